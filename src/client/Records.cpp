#include "client/Records.h"

namespace kvr::client {

Device Device::from(const Value& record) {
  const Value& type = record["deviceType"];
  Device device{record["name"].stringIfAny(), record["serialNumber"].stringIfAny(),
                record["activationDate"].dateIfAny(), Default};
  if (type.kind() == Value::Kind::UInt) device.deviceType = type.unsignedInteger();
  if (type.kind() == Value::Kind::Int) device.deviceType = static_cast<std::uint64_t>(type.integer());
  return device;
}

namespace {

constexpr double kFirstMillisecondEpoch = 1e10;
constexpr double kDay = 86400;  // seconds

/// Seconds, or milliseconds when there are too many of them.
std::optional<Date> epochDate(const Value& epoch) {
  if (!epoch.isNumber()) return std::nullopt;
  const double number = epoch.asDouble();
  return Date{number > kFirstMillisecondEpoch ? number / 1000 : number};
}

}  // namespace

Coverage Coverage::from(const Value& warranty) {
  const Value& features = warranty["featureToggleParameters"];
  Coverage coverage{warranty["covered"].asBool(),
                    warranty["coverageLocalizedLabel"].stringIfAny(),
                    warranty["coverageLocalizedDesc"].stringIfAny(),
                    epochDate(warranty["coverageEndDate"]),
                    features["zubOfferDisplay"].asBool(),
                    warranty["zubLocalizedOfferLabel"].stringIfAny(),
                    epochDate(warranty["zubOfferFollowupDisplayDate"]),
                    epochDate(warranty["zubOfferEligibleUntil"])};
  if (!coverage.offerFrom && coverage.offerEnd) {
    coverage.offerFrom = *coverage.offerEnd - features["zubOfferDurationDaysBeforeEndDate"].asDouble() * kDay;
  }
  return coverage;
}

DeviceInfo DeviceInfo::from(const Value& record) {
  const Value& warranty = record["warranty"]["DictionaryRepresentation"];
  return {Device::from(record["device"]), warranty.isDictionary() ? warranty : Value()};
}

}  // namespace kvr::client
