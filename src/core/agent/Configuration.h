#pragma once

#include "platform/services/Preferences.h"

namespace kvr {

/// The two hosts of the coverage service. An operator can store the URL preferences to use other servers.
inline constexpr const char* kCoverageServiceHost = "coverage.tarsil.example";
inline constexpr const char* kAssetHost = "assets.tarsil.example";

/// Registers the configuration defaults, which stored values override.
void kvr_registerDefaults(Preferences& preferences);

}  // namespace kvr
