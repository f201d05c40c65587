#pragma once

#include <string>
#include <string_view>

namespace kvr {

/// The SHA-256 of some bytes as 64 lower-case hexadecimal digits. Any thread.
std::string sha256Digits(std::string_view bytes);

/// The SHA-256 of a text's UTF-8 bytes, up to the first NUL, as 64 lower-case hexadecimal digits. Serial
/// numbers become file names and preference keys in this form only. Any thread.
inline std::string sha256Hash(std::string_view text) { return sha256Digits(text.substr(0, text.find('\0'))); }

}  // namespace kvr
