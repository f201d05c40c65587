#include "platform/codec/ASCIIPropertyList.h"

#include "platform/codec/PropertyListLimits.h"
#include "platform/codec/TreeBuilder.h"
#include "platform/text/Numbers.h"
#include "platform/text/UTF8.h"

#include <algorithm>

namespace kvr {
namespace {

/// The characters of octal escapes from \200 on, in the format's original 8-bit character set.
constexpr char16_t kUpperCharacters[] = {
    0x00A0, 0x00C0, 0x00C1, 0x00C2, 0x00C3, 0x00C4, 0x00C5, 0x00C7, 0x00C8, 0x00C9, 0x00CA, 0x00CB, 0x00CC,
    0x00CD, 0x00CE, 0x00CF, 0x00D0, 0x00D1, 0x00D2, 0x00D3, 0x00D4, 0x00D5, 0x00D6, 0x00D9, 0x00DA, 0x00DB,
    0x00DC, 0x00DD, 0x00DE, 0x00B5, 0x00D7, 0x00F7, 0x00A9, 0x00A1, 0x00A2, 0x00A3, 0x2044, 0x00A5, 0x0192,
    0x00A7, 0x00A4, 0x2019, 0x201C, 0x00AB, 0x2039, 0x203A, 0xFB01, 0xFB02, 0x00AE, 0x2013, 0x2020, 0x2021,
    0x00B7, 0x00A6, 0x00B6, 0x2022, 0x201A, 0x201E, 0x201D, 0x00BB, 0x2026, 0x2030, 0x00AC, 0x00BF, 0x00B9,
    0x02CB, 0x00B4, 0x02C6, 0x02DC, 0x00AF, 0x02D8, 0x02D9, 0x00A8, 0x00B2, 0x02DA, 0x00B8, 0x00B3, 0x02DD,
    0x02DB, 0x02C7, 0x2014, 0x00B1, 0x00BC, 0x00BD, 0x00BE, 0x00E0, 0x00E1, 0x00E2, 0x00E3, 0x00E4, 0x00E5,
    0x00E7, 0x00E8, 0x00E9, 0x00EA, 0x00EB, 0x00EC, 0x00C6, 0x00ED, 0x00AA, 0x00EE, 0x00EF, 0x00F0, 0x00F1,
    0x0141, 0x00D8, 0x0152, 0x00BA, 0x00F2, 0x00F3, 0x00F4, 0x00F5, 0x00F6, 0x00E6, 0x00F9, 0x00FA, 0x00FB,
    0x0131, 0x00FC, 0x00FD, 0x0142, 0x00F8, 0x0153, 0x00DF, 0x00FE, 0x00FF,
};

bool isLetter(char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); }

bool isWordCharacter(char c) {
  return isLetter(c) || (c >= '0' && c <= '9') ||
         std::string_view("_$/:.-").find(c) != std::string_view::npos;
}

/// Works through the text one value start or container end at a time.
class Reader {
 public:
  Reader(std::string_view text, TreeBuilder builder) : text_(text), builder_(std::move(builder)) {}

  Result<Value> read();

 private:
  bool readTree();
  bool readFirstValue();
  bool entry();
  bool element();
  bool startValue();
  bool addLeaf(Value leaf) { return take(builder_.add(std::move(leaf))) && separator(); }
  bool closeContainer() { return take(builder_.close()) && separator(); }
  bool separator();

  bool readString(std::string& text);
  bool readQuoted(std::string& text);
  bool readEscape(std::string& text);
  bool readOctal(std::string& text);
  bool readUnicode(std::string& text);
  bool readUnit(char32_t& unit);
  bool readData(Value::Bytes& bytes);

  bool skipBlanks();
  bool skipComment(std::string_view end, bool mayEndWithText);
  /// The next character, NUL at the end; the text itself holds none.
  char peek() const { return at_ < text_.size() ? text_[at_] : '\0'; }
  bool accept(char c) {
    if (peek() != c) return false;
    ++at_;
    return true;
  }
  bool fail(const char* problem) {
    problem_ = problem;
    return false;
  }
  bool take(bool taken) { return taken || fail(builder_.problem()); }

  const std::string_view text_;
  std::size_t at_ = 0;
  TreeBuilder builder_;
  bool isStringTable_ = false;  ///< the outermost dictionary has no braces
  const char* problem_ = "";
};

Result<Value> Reader::read() {
  if (text_.find('\0') != std::string_view::npos || !isUTF8(text_)) {
    return plistError("neither a binary nor an XML property list, and not text");
  }
  if (!readTree()) return plistError("byte " + std::to_string(at_) + ": " + problem_);
  return builder_.take();
}

bool Reader::readTree() {
  if (!skipBlanks() || !readFirstValue()) return false;
  while (!builder_.isComplete()) {
    if (!skipBlanks() || !(builder_.isInDictionary() ? entry() : element())) return false;
  }
  return skipBlanks() && (at_ == text_.size() || fail("more text after the end of the value"));
}

/// A string at the start is either the whole tree or the first key of a table of strings.
bool Reader::readFirstValue() {
  const char next = peek();
  if (next == '{' || next == '(' || next == '<') return startValue();
  std::string text;
  if (!readString(text) || !skipBlanks()) return false;
  if (peek() != '=') return addLeaf(std::move(text));
  isStringTable_ = true;
  ++at_;
  return take(builder_.openDictionary()) && take(builder_.setKey(std::move(text))) && startValue();
}

/// A key with the start of its value, or the end of the dictionary.
bool Reader::entry() {
  const bool isOutermost = isStringTable_ && builder_.depth() == 1;
  if (isOutermost ? at_ == text_.size() : accept('}')) return closeContainer();
  std::string key;
  if (!readString(key) || !take(builder_.setKey(std::move(key))) || !skipBlanks()) return false;
  if (!accept('=')) return fail("no '=' after a key");
  return startValue();
}

/// The start of an array's element, or the end of the array.
bool Reader::element() { return accept(')') ? closeContainer() : startValue(); }

/// A whole leaf, or the start of a container.
bool Reader::startValue() {
  if (!skipBlanks()) return false;
  if (accept('{')) return take(builder_.openDictionary());
  if (accept('(')) return take(builder_.openArray());
  if (accept('<')) {
    Value::Bytes bytes;
    return readData(bytes) && addLeaf(std::move(bytes));
  }
  std::string text;
  return readString(text) && addLeaf(std::move(text));
}

/// Reads what must follow a value in its container.
bool Reader::separator() {
  if (builder_.isComplete()) return true;
  if (!skipBlanks()) return false;
  if (builder_.isInDictionary()) return accept(';') || fail("no ';' after a dictionary's value");
  return accept(',') || peek() == ')' || fail("no ',' or ')' after an array's element");
}

bool Reader::readString(std::string& text) {
  if (peek() == '"' || peek() == '\'') return readQuoted(text);
  const auto start = at_;
  while (isWordCharacter(peek())) ++at_;
  text = text_.substr(start, at_ - start);
  return !text.empty() || fail(at_ == text_.size() ? "the text ends too early" : "unexpected character");
}

bool Reader::readQuoted(std::string& text) {
  const char quote = text_[at_++];
  const char stops[] = {quote, '\\'};
  while (true) {
    const auto stop = std::min(text_.find_first_of({stops, 2}, at_), text_.size());
    text += text_.substr(at_, stop - at_);
    at_ = stop;
    if (accept(quote)) return true;
    if (!accept('\\')) return fail("no end of a quoted string");
    if (!readEscape(text)) return false;
  }
}

bool Reader::readEscape(std::string& text) {
  const char c = peek();
  if (c >= '0' && c <= '7') return readOctal(text);
  if (c == '\0') return fail("no end of a quoted string");
  ++at_;
  switch (c) {
    case 'a':
      text += '\a';
      return true;
    case 'b':
      text += '\b';
      return true;
    case 'f':
      text += '\f';
      return true;
    case 'n':
      text += '\n';
      return true;
    case 'r':
      text += '\r';
      return true;
    case 't':
      text += '\t';
      return true;
    case 'v':
      text += '\v';
      return true;
    case 'U':
      return readUnicode(text);
    default:
      text += c;
      return !isLetter(c) || fail("unknown escape");
  }
}

bool Reader::readOctal(std::string& text) {
  unsigned code = 0;
  for (int digits = 0; digits < 3 && peek() >= '0' && peek() <= '7'; ++digits) {
    code = code * 8 + static_cast<unsigned>(text_[at_++] - '0');
  }
  if (code >= 0x80 + std::size(kUpperCharacters)) return fail("an octal escape for no character");
  appendUTF8(text, code < 0x80 ? code : kUpperCharacters[code - 0x80]);
  return true;
}

/// The digits of \Uxxxx; a character beyond U+FFFF takes two of them in a row.
bool Reader::readUnicode(std::string& text) {
  char32_t codePoint = 0;
  if (!readUnit(codePoint)) return false;
  if (isHighSurrogate(codePoint)) {
    char32_t low = 0;
    if (!accept('\\') || !accept('U') || !readUnit(low)) return fail("half a character");
    if (!isLowSurrogate(low)) return fail("half a character");
    codePoint = joinSurrogates(codePoint, low);
  } else if (isLowSurrogate(codePoint)) {
    return fail("half a character");
  }
  appendUTF8(text, codePoint);
  return true;
}

bool Reader::readUnit(char32_t& unit) {
  for (int digits = 0; digits < 4; ++digits) {
    const auto digit = hexadecimalDigit(peek());
    if (digit < 0) return fail("\\U without four digits");
    unit = unit * 16 + static_cast<char32_t>(digit);
    ++at_;
  }
  return true;
}

bool Reader::readData(Value::Bytes& bytes) {
  int pending = -1;
  for (; !accept('>'); ++at_) {
    const char c = peek();
    if (c == ' ' || c == '\t' || c == '\n' || c == '\r') continue;
    const auto digit = hexadecimalDigit(c);
    if (digit < 0) return fail("unexpected character in data");
    if (pending < 0) {
      pending = digit;
    } else {
      bytes.push_back(static_cast<std::uint8_t>(pending * 16 + digit));
      pending = -1;
    }
  }
  return pending < 0 || fail("half a byte of data");
}

bool Reader::skipBlanks() {
  while (true) {
    at_ = std::min(text_.find_first_not_of(" \t\n\r\v\f", at_), text_.size());
    const auto rest = text_.substr(at_);
    if (rest.starts_with("//")) {
      if (!skipComment("\n", true)) return false;
    } else if (rest.starts_with("/*")) {
      if (!skipComment("*/", false)) return false;
    } else {
      return true;
    }
  }
}

bool Reader::skipComment(std::string_view end, bool mayEndWithText) {
  const auto found = text_.find(end, at_ + 2);
  if (found == std::string_view::npos && !mayEndWithText) return fail("no end of a comment");
  at_ = found == std::string_view::npos ? text_.size() : found + end.size();
  return true;
}

}  // namespace

Result<Value> readASCIIPropertyList(std::string_view bytes) {
  return readASCIIPropertyList(bytes, TreeBuilder(kMaximumValues));
}

Result<Value> readASCIIPropertyList(std::string_view bytes, TreeBuilder builder) {
  const bool isBigEndian = bytes.starts_with("\xFE\xFF");
  if (isBigEndian || bytes.starts_with("\xFF\xFE")) {
    const auto text = utf8FromUTF16(bytes.substr(2), isBigEndian ? ByteOrder::Big : ByteOrder::Little);
    if (!text) return plistError("text that is not UTF-16 as it says");
    return Reader(*text, std::move(builder)).read();
  }
  if (bytes.starts_with("\xEF\xBB\xBF")) bytes.remove_prefix(3);
  return Reader(bytes, std::move(builder)).read();
}

}  // namespace kvr
