#include "platform/codec/PropertyList.h"
#include "platform/codec/PropertyListLimits.h"
#include "platform/codec/XMLPropertyList.h"
#include "platform/text/Base64.h"
#include "platform/text/Numbers.h"
#include "platform/text/UTF8.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>

namespace kvr {
namespace {

bool isForbidden(char32_t codePoint) {
  return (codePoint < 0x20 && codePoint != '\t' && codePoint != '\n' && codePoint != '\r') ||
         codePoint == 0xFFFE || codePoint == 0xFFFF;
}

/// The escape for a character in an element's text; empty if it needs none.
std::string_view escapeOf(char c) {
  switch (c) {
    case '&':
      return "&amp;";
    case '<':
      return "&lt;";
    case '>':
      return "&gt;";
    case '\r':
      return "&#13;";  // unescaped, a reader would make it a line feed
    default:
      return {};
  }
}

/// Recurses once per level, `kMaximumDepth` levels at most.
class Writer {
 public:
  Result<std::string> write(const Value& tree) {
    out_ = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";
    if (!append(tree)) return plistError(problem_);
    out_ += "</plist>\n";
    return std::move(out_);
  }

 private:
  bool append(const Value& value);
  bool appendArray(const Value::Array& array);
  bool appendDictionary(const Value::Dictionary& dictionary);
  bool appendText(std::string_view tag, std::string_view text);
  bool appendDate(Date date);
  void appendReal(double number);
  void appendData(const Value::Bytes& bytes);

  bool appendContainer(std::string_view tag, bool empty, auto&& appendContent);
  /// Limited, because deep trees would be mostly tabs.
  void indent() {
    constexpr std::size_t kMostTabs = 16;
    out_.append(std::min(depth_, kMostTabs), '\t');
  }
  bool line(std::string_view markup) {
    indent();
    out_ += markup;
    out_ += '\n';
    return true;
  }
  bool refuse(const char* problem) {
    problem_ = problem;
    return false;
  }

  std::string out_;
  std::size_t depth_ = 0;
  std::size_t values_ = 0;
  const char* problem_ = "";
};

bool Writer::append(const Value& value) {
  if (++values_ > kMaximumValues) return refuse("too many values");
  switch (value.kind()) {
    case Value::Kind::Null:
      return refuse("XML holds no null");
    case Value::Kind::Bool:
      return line(value.boolean() ? "<true/>" : "<false/>");
    case Value::Kind::Int:
      return line("<integer>" + std::to_string(value.integer()) + "</integer>");
    case Value::Kind::UInt:
      return line("<integer>" + std::to_string(value.unsignedInteger()) + "</integer>");
    case Value::Kind::Real:
      appendReal(value.real());
      return true;
    case Value::Kind::String:
      return appendText("string", value.string());
    case Value::Kind::Date:
      return appendDate(value.date());
    case Value::Kind::Data:
      appendData(value.data());
      return true;
    case Value::Kind::Array:
      return appendArray(value.array());
    case Value::Kind::Dictionary:
      return appendDictionary(value.dictionary());
  }
  return false;
}

bool Writer::appendContainer(std::string_view tag, bool empty, auto&& appendContent) {
  if (depth_ == kMaximumDepth) return refuse("nested too deep");
  const std::string name(tag);
  if (empty) return line("<" + name + "/>");
  line("<" + name + ">");
  ++depth_;
  if (!appendContent()) return false;
  --depth_;
  return line("</" + name + ">");
}

bool Writer::appendArray(const Value::Array& array) {
  return appendContainer("array", array.empty(), [&] {
    for (const auto& element : array) {
      if (!append(element)) return false;
    }
    return true;
  });
}

bool Writer::appendDictionary(const Value::Dictionary& dictionary) {
  return appendContainer("dict", dictionary.empty(), [&] {
    for (const auto& [key, element] : dictionary) {
      if (!appendText("key", key) || !append(element)) return false;
    }
    return true;
  });
}

bool Writer::appendText(std::string_view tag, std::string_view text) {
  indent();
  ((out_ += '<') += tag) += '>';
  std::size_t written = 0;
  for (std::size_t at = 0; at < text.size();) {
    const auto start = at;
    const char32_t codePoint = nextCodePoint(text, at);
    if (codePoint == kNoCodePoint) return refuse("text that is not UTF-8");
    if (isForbidden(codePoint)) return refuse("XML holds no such character");
    if (codePoint >= 0x80) continue;
    if (const auto escape = escapeOf(text[start]); !escape.empty()) {
      out_ += text.substr(written, start - written);
      out_ += escape;
      written = at;
    }
  }
  out_ += text.substr(written);
  ((out_ += "</") += tag) += ">\n";
  return true;
}

void Writer::appendReal(double number) {
  std::string text;
  if (std::isnan(number)) {
    text = "nan";
  } else if (std::isinf(number)) {
    text = number < 0 ? "-infinity" : "+infinity";
  } else {
    appendNumber(text, number);
  }
  line("<real>" + text + "</real>");
}

bool Writer::appendDate(Date date) {
  if (!isInCalendar(date)) return refuse("XML holds no date outside the calendar");
  const auto time = calendarTime(static_cast<long long>(std::floor(date.secondsSince1970)));
  char text[64];
  std::snprintf(text, sizeof text, "<date>%s%04lld-%02d-%02dT%02d:%02d:%02dZ</date>",
                time.year < 0 ? "-" : "", std::abs(time.year), time.month, time.day, time.hour, time.minute,
                time.second);
  return line(text);
}

void Writer::appendData(const Value::Bytes& bytes) {
  constexpr std::size_t kLineLength = 76;
  const auto encoded = base64Encode(bytes);
  line("<data>");
  for (std::size_t at = 0; at < encoded.size(); at += kLineLength) {
    line(std::string_view(encoded).substr(at, kLineLength));
  }
  line("</data>");
}

}  // namespace

Result<std::string> writeXMLPropertyList(const Value& tree) { return Writer().write(tree); }

}  // namespace kvr
