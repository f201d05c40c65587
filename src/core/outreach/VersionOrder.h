#pragma once

#include <compare>
#include <string_view>

namespace kvr {

/// Compares as text, but each run of digits as a number: 17.10 comes after 17.9, and 17.09 equals 17.9.
std::weak_ordering compareVersions(std::string_view left, std::string_view right);

}  // namespace kvr
