#include "platform/text/Base64.h"

#include <openssl/evp.h>

#include <algorithm>
#include <array>

namespace kvr {
namespace {

constexpr std::string_view kAlphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
/// How many bytes are encoded at once: a multiple of 3, so that only the last piece is padded, and far below
/// the limit of the library's int lengths.
constexpr std::size_t kPiece = 3UL << 20U;
constexpr std::uint8_t kNoDigit = 0xFF;
constexpr std::uint8_t kBlank = 0xFE;

constexpr auto kMeanings = [] {
  std::array<std::uint8_t, 256> meanings{};
  meanings.fill(kNoDigit);
  for (std::size_t i = 0; i < kAlphabet.size(); ++i) {
    meanings[static_cast<unsigned char>(kAlphabet[i])] = static_cast<std::uint8_t>(i);
  }
  for (const char c : {' ', '\t', '\n', '\r'}) meanings[static_cast<unsigned char>(c)] = kBlank;
  return meanings;
}();

}  // namespace

std::string base64Encode(std::string_view bytes) {
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

std::optional<std::vector<std::uint8_t>> base64Decode(std::string_view text) {
  std::vector<std::uint8_t> out;
  out.reserve(text.size() / 4 * 3);
  unsigned pending = 0;
  unsigned pendingBits = 0;
  std::size_t digits = 0;
  std::size_t padding = 0;
  for (const char c : text) {
    const auto meaning = kMeanings[static_cast<unsigned char>(c)];
    if (meaning == kBlank) continue;
    if (c == '=') {
      ++padding;
      continue;
    }
    if (meaning == kNoDigit || padding > 0) return std::nullopt;
    ++digits;
    pending = (pending << 6U) | meaning;
    pendingBits += 6;
    if (pendingBits >= 8) {
      pendingBits -= 8;
      out.push_back(static_cast<std::uint8_t>(pending >> pendingBits));
      pending &= (1U << pendingBits) - 1;
    }
  }
  const bool whole = (digits + padding) % 4 == 0 && padding < 3 && digits % 4 != 1;
  if (!whole || pending != 0) return std::nullopt;
  return out;
}

}  // namespace kvr
