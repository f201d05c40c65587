#include "client/Records.h"

#include "platform/value/EpochNumber.h"

namespace kvr::client {

Device Device::from(const Value& record) {
  const Value& type = record["deviceType"];
  Device device{record["name"].stringIfAny(), record["serialNumber"].stringIfAny(),
                record["activationDate"].dateIfAny(), Default};
  if (type.kind() == Value::Kind::UInt) device.deviceType = type.unsignedInteger();
  if (type.kind() == Value::Kind::Int) device.deviceType = static_cast<std::uint64_t>(type.integer());
  return device;
}

Coverage Coverage::from(const Value& warranty) {
  constexpr double kDay = 86400;  // seconds
  const Value& features = warranty["featureToggleParameters"];
  Coverage coverage{warranty["covered"].asBool(),
                    warranty["coverageLocalizedLabel"].stringIfAny(),
                    warranty["coverageLocalizedDesc"].stringIfAny(),
                    dateWithEpochNumber(warranty["coverageEndDate"]),
                    features["zubOfferDisplay"].asBool(),
                    warranty["zubLocalizedOfferLabel"].stringIfAny(),
                    dateWithEpochNumber(warranty["zubOfferFollowupDisplayDate"]),
                    dateWithEpochNumber(warranty["zubOfferEligibleUntil"])};
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
