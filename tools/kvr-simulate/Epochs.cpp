#include "kvr-simulate/Epochs.h"

#include <cmath>
#include <limits>

namespace kvr::simulate {
namespace {

constexpr double kDay = 86400;
constexpr std::uint64_t kMostSeconds = 10'000'000'000;

}  // namespace

Value drawEpoch(Dice& dice, Date today, double leastDays, double mostDays) {
  const Date date = today + dice.between(leastDays, mostDays) * kDay;
  const auto seconds = static_cast<long long>(date.secondsSince1970);
  if (dice.happens(0.9)) return seconds;
  return dice.oneOf<Value>({-1, -seconds, -1.5, std::numeric_limits<std::int64_t>::min(), -0.5, 0, 0.75,
                            date.secondsSince1970, 1000 * seconds, kMostSeconds, kMostSeconds + 1,
                            std::numeric_limits<std::uint64_t>::max(), "soon"});
}

std::optional<Date> dateOf(const Value& epoch) {
  std::uint64_t number = 0;
  if (epoch.kind() == Value::Kind::Real) {
    const double whole = std::trunc(epoch.real());
    number = whole < 0 ? 0 - static_cast<std::uint64_t>(-whole) : static_cast<std::uint64_t>(whole);
  } else if (epoch.kind() == Value::Kind::Int) {
    number = static_cast<std::uint64_t>(epoch.integer());
  } else if (epoch.kind() == Value::Kind::UInt) {
    number = epoch.unsignedInteger();
  } else {
    return std::nullopt;
  }
  return Date{static_cast<double>(number > kMostSeconds ? number / 1000 : number)};
}

std::optional<Date> conversionDateIn(const Value& warranty, double day) {
  const Value& sent = warranty["zubOfferConversionDate"];
  if (!sent.isNull()) return sent.asDouble() == 0 ? std::nullopt : dateOf(sent);
  const auto end = dateOf(warranty["coverageEndDate"]);
  return end ? std::optional(*end + day) : std::nullopt;
}

}  // namespace kvr::simulate
