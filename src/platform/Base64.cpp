#include "platform/Base64.h"

#include <array>

namespace kvr {
namespace {

constexpr std::string_view kAlphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
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

std::string base64Encode(std::span<const std::uint8_t> bytes) {
  std::string out;
  out.reserve((bytes.size() + 2) / 3 * 4);
  for (std::size_t at = 0; at < bytes.size(); at += 3) {
    const auto left = bytes.size() - at;
    const unsigned group = (static_cast<unsigned>(bytes[at]) << 16U) |
                           (left > 1 ? static_cast<unsigned>(bytes[at + 1]) << 8U : 0U) |
                           (left > 2 ? static_cast<unsigned>(bytes[at + 2]) : 0U);
    out += kAlphabet[group >> 18U];
    out += kAlphabet[(group >> 12U) & 0x3FU];
    out += left > 1 ? kAlphabet[(group >> 6U) & 0x3FU] : '=';
    out += left > 2 ? kAlphabet[group & 0x3FU] : '=';
  }
  return out;
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
