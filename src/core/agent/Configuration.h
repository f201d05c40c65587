#pragma once

#include "platform/services/Preferences.h"

namespace kvr {

/// The two hosts of the coverage service. An operator points the agent elsewhere by storing the URL
/// preferences.
inline constexpr const char* kCoverageServiceHost = "coverage.tarsil.example";
inline constexpr const char* kAssetHost = "assets.tarsil.example";

/// Registers the configuration defaults: fallbacks that a stored value overrides.
void kvr_registerDefaults(Preferences& preferences);

}  // namespace kvr
