#include "platform/services/HTTP.h"

#include <algorithm>

namespace kvr {
namespace {

bool isSameName(std::string_view left, std::string_view right) {
  const auto lowered = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; };
  return std::ranges::equal(left, right, {}, lowered, lowered);
}

}  // namespace

bool isHTTPToken(std::string_view text) {
  return !text.empty() && std::ranges::all_of(text, [](char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
           std::string_view("!#$%&'*+-.^_`|~").find(c) != std::string_view::npos;
  });
}

std::optional<std::string> HTTPHeaders::objectionTo(std::string_view name, std::string_view value) {
  if (!isHTTPToken(name)) return "invalid header name";
  const std::string text(name);
  if (value.find_first_of(std::string_view("\r\n\0", 3)) != std::string_view::npos) {
    return "line break or NUL in the header " + text;
  }
  // The transport sets the message length. A second, different length would let a receiver split the message.
  for (const auto* framing : {"Content-Length", "Transfer-Encoding"}) {
    if (isSameName(name, framing)) return text + " cannot be set";
  }
  return std::nullopt;
}

void HTTPHeaders::set(std::string_view name, std::optional<std::string> value) {
  const auto existing =
      std::ranges::find_if(fields_, [&](const Field& field) { return isSameName(field.first, name); });
  if (!value) {
    if (existing != fields_.end()) fields_.erase(existing);
  } else if (existing == fields_.end()) {
    fields_.emplace_back(name, *std::move(value));
  } else {
    *existing = {std::string(name), *std::move(value)};
  }
}

std::optional<std::string> HTTPHeaders::value(std::string_view name) const {
  for (const Field& field : fields_) {
    if (isSameName(field.first, name)) return field.second;
  }
  return std::nullopt;
}

}  // namespace kvr
