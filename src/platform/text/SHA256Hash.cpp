#include "platform/text/SHA256Hash.h"

#include <openssl/sha.h>

#include <array>

namespace kvr {

std::string sha256Digits(std::string_view bytes) {
  std::array<unsigned char, SHA256_DIGEST_LENGTH> digest{};
  SHA256(reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size(), digest.data());

  constexpr std::string_view kDigits = "0123456789abcdef";
  std::string digits;
  digits.reserve(2 * digest.size());
  for (const auto byte : digest) {
    digits += kDigits[byte >> 4U];
    digits += kDigits[byte & 0xFU];
  }
  return digits;
}

}  // namespace kvr
