#pragma once

#include <cstddef>
#include <cstdint>

namespace kvr {

// The interface of libkvragent-locale.so, which is loaded when the first number is formatted.
inline constexpr const char* kLocaleModuleFile = "libkvragent-locale.so";
inline constexpr const char* kDecimalStringSymbol = "kvr_decimal_string";

/// Writes a number in a locale's decimal style as UTF-8, without a final NUL, into a buffer of `size` bytes.
/// Returns the length, or -1 when it cannot be written or does not fit.
using DecimalString = int (*)(const char* locale, std::uint64_t number, char* buffer, std::size_t size);

}  // namespace kvr
