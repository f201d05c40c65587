#include "signing/SHA256Hash.h"

#include <openssl/sha.h>

#include <array>

namespace kvr {

std::string sha256Hash(std::string_view text) {
  text = text.substr(0, text.find('\0'));
  std::array<unsigned char, SHA256_DIGEST_LENGTH> digest{};
  SHA256(reinterpret_cast<const unsigned char*>(text.data()), text.size(), digest.data());

  constexpr std::string_view kDigits = "0123456789abcdef";
  std::string hash;
  hash.reserve(2 * digest.size());
  for (const auto byte : digest) {
    hash += kDigits[byte >> 4U];
    hash += kDigits[byte & 0xFU];
  }
  return hash;
}

}  // namespace kvr
