#include "platform/text/Numbers.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <limits>

namespace kvr {
namespace {

/// The power of ten of the first significant digit of a non-zero number, saturated.
long long decimalMagnitude(std::string_view number) {
  constexpr long long kSaturated = 1LL << 40;
  const auto exponentAt = number.find_first_of("eE");
  long long exponent = 0;
  if (exponentAt != std::string_view::npos) {
    auto text = number.substr(exponentAt + 1);
    if (text.starts_with('+')) text.remove_prefix(1);
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), exponent);
    if (error == std::errc::result_out_of_range || std::abs(exponent) > kSaturated) {
      exponent = text.starts_with('-') ? -kSaturated : kSaturated;
    }
  }
  const auto digits = number.substr(0, exponentAt);
  const auto first = digits.find_first_of("123456789");
  const auto point = std::min(digits.find('.'), digits.size());
  const auto place = static_cast<long long>(point) - static_cast<long long>(first);
  return exponent + (place > 0 ? place - 1 : place);
}

}  // namespace

std::from_chars_result readReal(std::string_view text, double& number) {
  auto result = std::from_chars(text.data(), text.data() + text.size(), number);
  if (result.ec != std::errc::result_out_of_range) return result;
  const std::string_view read(text.data(), static_cast<std::size_t>(result.ptr - text.data()));
  const bool tiny = decimalMagnitude(read) < 0;
  if (tiny) result.ec = std::errc();
  number =
      std::copysign(tiny ? 0.0 : std::numeric_limits<double>::infinity(), read.starts_with('-') ? -1.0 : 1.0);
  return result;
}

}  // namespace kvr
