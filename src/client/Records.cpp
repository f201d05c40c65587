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

DeviceInfo DeviceInfo::from(const Value& record) {
  const Value& warranty = record["warranty"]["DictionaryRepresentation"];
  return {Device::from(record["device"]), warranty.isDictionary() ? warranty : Value()};
}

}  // namespace kvr::client
