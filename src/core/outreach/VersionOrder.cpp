#include "core/outreach/VersionOrder.h"

#include <algorithm>

namespace kvr {
namespace {

bool isDigit(char c) { return c >= '0' && c <= '9'; }

/// Takes the digits at the start of `text`, without leading zeros.
std::string_view takeNumber(std::string_view& text) {
  const auto length =
      static_cast<std::size_t>(std::find_if_not(text.begin(), text.end(), isDigit) - text.begin());
  std::string_view digits = text.substr(0, length);
  text.remove_prefix(length);
  digits.remove_prefix(std::min(digits.find_first_not_of('0'), digits.size()));
  return digits;
}

}  // namespace

std::weak_ordering compareVersions(std::string_view left, std::string_view right) {
  while (!left.empty() && !right.empty()) {
    if (isDigit(left.front()) && isDigit(right.front())) {
      const auto leftNumber = takeNumber(left);
      const auto rightNumber = takeNumber(right);
      if (leftNumber.size() != rightNumber.size()) return leftNumber.size() <=> rightNumber.size();
      if (leftNumber != rightNumber) return leftNumber <=> rightNumber;
      continue;
    }
    if (left.front() != right.front()) {
      return static_cast<unsigned char>(left.front()) <=> static_cast<unsigned char>(right.front());
    }
    left.remove_prefix(1);
    right.remove_prefix(1);
  }
  return left.size() <=> right.size();
}

}  // namespace kvr
