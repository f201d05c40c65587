#include "signing/Base64.h"

#include <openssl/evp.h>

#include <algorithm>

namespace kvr {

namespace {

/// How much is encoded at once: a multiple of 3, so that only the last piece is padded, and far below what
/// the library's int lengths hold.
constexpr std::size_t kPiece = 3UL << 20U;

}  // namespace

std::string base64Encoded(std::string_view bytes) {
  // The encoder ends each piece with a NUL, which the next one overwrites.
  std::string text((bytes.size() + 2) / 3 * 4 + 1, '\0');
  std::size_t written = 0;
  for (std::size_t at = 0; at < bytes.size(); at += kPiece) {
    const auto length = std::min(kPiece, bytes.size() - at);
    written += static_cast<std::size_t>(
        EVP_EncodeBlock(reinterpret_cast<unsigned char*>(text.data()) + written,
                        reinterpret_cast<const unsigned char*>(bytes.data()) + at, static_cast<int>(length)));
  }
  text.resize(written);
  return text;
}

}  // namespace kvr
