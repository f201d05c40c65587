#pragma once

#include "platform/value/Error.h"

#include <cstddef>
#include <string>
#include <utility>

namespace kvr {

// What the codecs of property lists have in common.

/// The most values a tree may hold. A shared value counts once for each use; keys do not count.
inline constexpr std::size_t kMaximumValues = std::size_t{1} << 20U;

inline Error plistError(std::string message) { return {"plist", 0, std::move(message)}; }

}  // namespace kvr
