#include "platform/text/UTF8.h"

namespace kvr {
namespace {

char32_t byteAt(std::string_view text, std::size_t at) { return static_cast<unsigned char>(text[at]); }

/// The smallest code point for each encoded length; a smaller one of that length is an overlong form.
constexpr char32_t kLeast[] = {0, 0, 0x80, 0x800, 0x10000};

void appendUnit(std::string& out, char32_t unit) {
  out += static_cast<char>(unit >> 8U);
  out += static_cast<char>(unit & 0xFFU);
}

}  // namespace

char32_t nextCodePoint(std::string_view text, std::size_t& at) {
  const char32_t first = byteAt(text, at);
  if (first < 0x80) {
    ++at;
    return first;
  }
  const std::size_t length = first >= 0xF0 ? 4 : first >= 0xE0 ? 3 : 2;
  if (first < 0xC2 || first > 0xF4 || text.size() - at < length) return kNoCodePoint;
  char32_t codePoint = first & (0xFFU >> (length + 1));
  for (std::size_t i = 1; i < length; ++i) {
    const char32_t next = byteAt(text, at + i);
    if ((next & 0xC0U) != 0x80) return kNoCodePoint;
    codePoint = (codePoint << 6U) | (next & 0x3FU);
  }
  if (codePoint < kLeast[length] || codePoint > 0x10FFFF || (codePoint >= 0xD800 && codePoint <= 0xDFFF)) {
    return kNoCodePoint;
  }
  at += length;
  return codePoint;
}

bool isUTF8(std::string_view text) {
  for (std::size_t at = 0; at < text.size();) {
    if (nextCodePoint(text, at) == kNoCodePoint) return false;
  }
  return true;
}

void appendUTF8(std::string& out, char32_t codePoint) {
  const auto continuation = [codePoint](unsigned shift) {
    return static_cast<char>(0x80U | ((codePoint >> shift) & 0x3FU));
  };
  if (codePoint < 0x80) {
    out += static_cast<char>(codePoint);
  } else if (codePoint < 0x800) {
    out += static_cast<char>(0xC0U | (codePoint >> 6U));
    out += continuation(0);
  } else if (codePoint < 0x10000) {
    out += static_cast<char>(0xE0U | (codePoint >> 12U));
    out += continuation(6);
    out += continuation(0);
  } else {
    out += static_cast<char>(0xF0U | (codePoint >> 18U));
    out += continuation(12);
    out += continuation(6);
    out += continuation(0);
  }
}

std::optional<std::string> utf8FromUTF16(std::string_view bytes, ByteOrder order) {
  if (bytes.size() % 2 != 0) return std::nullopt;
  const auto unitAt = [bytes, order](std::size_t at) {
    const char32_t first = byteAt(bytes, at);
    const char32_t second = byteAt(bytes, at + 1);
    return order == ByteOrder::Big ? (first << 8U) | second : (second << 8U) | first;
  };
  std::string out;
  out.reserve(bytes.size());
  for (std::size_t at = 0; at < bytes.size(); at += 2) {
    char32_t unit = unitAt(at);
    if (isLowSurrogate(unit)) return std::nullopt;
    if (isHighSurrogate(unit)) {
      at += 2;
      if (at == bytes.size() || !isLowSurrogate(unitAt(at))) return std::nullopt;
      unit = joinSurrogates(unit, unitAt(at));
    }
    appendUTF8(out, unit);
  }
  return out;
}

std::optional<std::string> utf16FromUTF8(std::string_view text) {
  std::string out;
  out.reserve(text.size() * 2);
  for (std::size_t at = 0; at < text.size();) {
    const char32_t codePoint = nextCodePoint(text, at);
    if (codePoint == kNoCodePoint) return std::nullopt;
    if (codePoint < 0x10000) {
      appendUnit(out, codePoint);
    } else {
      appendUnit(out, 0xD800 + ((codePoint - 0x10000) >> 10U));
      appendUnit(out, 0xDC00 + ((codePoint - 0x10000) & 0x3FFU));
    }
  }
  return out;
}

}  // namespace kvr
