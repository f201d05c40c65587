#include "platform/log/Format.h"

#include <charconv>
#include <cstdio>

namespace kvr {

namespace format_detail {

void appendInteger(std::string& out, long long number) {
  char text[24];
  out.append(text, std::to_chars(text, text + sizeof text, number).ptr);
}

void appendUnsigned(std::string& out, unsigned long long number) {
  char text[24];
  out.append(text, std::to_chars(text, text + sizeof text, number).ptr);
}

void appendReal(std::string& out, double number, std::string_view precision) {
  int digits = 6;
  if (precision.size() > 1)
    std::from_chars(precision.data() + 1, precision.data() + precision.size(), digits);
  char text[512];  // the largest double has 309 digits before the point
  const int length = std::snprintf(text, sizeof text, "%.*f", digits, number);
  out.append(text, std::min(static_cast<std::size_t>(length), sizeof text - 1));
}

std::string fill(std::string_view text, std::span<const Argument> arguments, bool revealPrivate) {
  std::string out;
  out.reserve(text.size() + 64);
  std::size_t at = 0;
  std::size_t next = 0;
  while (const auto placeholder = nextPlaceholder(text, at)) {
    out += text.substr(at, placeholder->begin - at);
    at = placeholder->end;
    if (next == arguments.size()) break;
    const auto& argument = arguments[next++];
    if (placeholder->isPrivate && !revealPrivate) {
      out += "<private>";
    } else {
      argument.appendTo(out, argument.object, placeholder->precision);
    }
  }
  if (at < text.size()) out += text.substr(at);
  return out;
}

}  // namespace format_detail
}  // namespace kvr
