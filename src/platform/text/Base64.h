#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace kvr {

/// The standard alphabet, padded, on one line.
std::string base64Encode(std::string_view bytes);
inline std::string base64Encode(std::span<const std::uint8_t> bytes) {
  return base64Encode(std::string_view(reinterpret_cast<const char*>(bytes.data()), bytes.size()));
}

/// Ignores blanks and line breaks; returns nothing unless the rest is exactly what an encoder writes.
std::optional<std::vector<std::uint8_t>> base64Decode(std::string_view text);

}  // namespace kvr
