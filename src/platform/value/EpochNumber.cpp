#include "platform/value/EpochNumber.h"

#include <cstdint>
#include <limits>

namespace kvr {
namespace {

constexpr std::uint64_t kLargestSeconds = 10'000'000'000;
constexpr double kTwoTo64 = 18446744073709551616.0;

std::uint64_t asUnsigned(const Value& number) {
  if (number.kind() == Value::Kind::UInt) return number.unsignedInteger();
  if (number.kind() == Value::Kind::Real && number.real() > 0) {
    if (number.real() >= kTwoTo64) return std::numeric_limits<std::uint64_t>::max();
    return static_cast<std::uint64_t>(number.real());
  }
  return static_cast<std::uint64_t>(number.asInteger());
}

}  // namespace

std::optional<Date> dateWithEpochNumber(const Value& number) {
  if (!number.isNumber() && !number.isBool()) return std::nullopt;
  auto seconds = asUnsigned(number);
  if (seconds > kLargestSeconds) seconds /= 1000;
  return Date{static_cast<double>(seconds)};
}

}  // namespace kvr
