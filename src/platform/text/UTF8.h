#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace kvr {

/// What `nextCodePoint` gives in place of a code point for bytes that are not UTF-8.
inline constexpr char32_t kNoCodePoint = 0xFFFFFFFF;

/// Reads the code point at `at`, which must be below the size, and moves `at` past it. Bytes that are not
/// well-formed (surrogates, overlong and truncated forms included) give `kNoCodePoint` and leave `at` in
/// place.
char32_t nextCodePoint(std::string_view text, std::size_t& at);

/// Whether the whole text is well-formed.
bool isUTF8(std::string_view text);

/// `codePoint` must be no surrogate and at most U+10FFFF.
void appendUTF8(std::string& out, char32_t codePoint);

constexpr bool isHighSurrogate(char32_t unit) { return unit >= 0xD800 && unit <= 0xDBFF; }
constexpr bool isLowSurrogate(char32_t unit) { return unit >= 0xDC00 && unit <= 0xDFFF; }
constexpr char32_t joinSurrogates(char32_t high, char32_t low) {
  return 0x10000 + ((high - 0xD800) << 10U) + (low - 0xDC00);
}

enum class ByteOrder { Big, Little };

/// UTF-16 without byte order mark as UTF-8; nothing if there is an unpaired surrogate or half a unit is left
/// over.
std::optional<std::string> utf8FromUTF16(std::string_view bytes, ByteOrder order);

/// Well-formed UTF-8 as UTF-16, big-endian; nothing when it is not well-formed.
std::optional<std::string> utf16FromUTF8(std::string_view text);

}  // namespace kvr
