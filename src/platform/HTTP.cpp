#include "platform/HTTP.h"

#include <algorithm>

namespace kvr {
namespace {

bool isSameName(std::string_view left, std::string_view right) {
  const auto lowered = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; };
  return std::ranges::equal(left, right, {}, lowered, lowered);
}

}  // namespace

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
