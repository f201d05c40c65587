#pragma once

#include <cstddef>
#include <string_view>

namespace kvr {

/// Far above any maker's serial numbers, far below what could flood a log or a request.
inline constexpr std::size_t kLongestSerialNumber = 128;

/// What keeps a text from being a serial number, to follow "it"; null when nothing does. A NUL would give two
/// serial numbers one hash, a slash would name another directory.
constexpr const char* faultOfSerialNumber(std::string_view serialNumber) {
  if (serialNumber.empty()) return "is empty";
  if (serialNumber.size() > kLongestSerialNumber) return "is too long";
  for (const char c : serialNumber) {
    if (c == '/') return "holds a slash";
    if (static_cast<unsigned char>(c) < 0x20 || c == 0x7F) return "holds a control character";
  }
  return nullptr;
}

}  // namespace kvr
