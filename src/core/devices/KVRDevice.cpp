#include "core/devices/KVRDevice.h"

#include "platform/log/Format.h"

namespace kvr {
namespace {

constexpr const char* kName = "name";
constexpr const char* kSerialNumber = "serialNumber";
constexpr const char* kActivationDate = "activationDate";
constexpr const char* kDeviceType = "deviceType";

std::uint64_t typeFrom(const Value& number) {
  if (number.kind() == Value::Kind::UInt) return number.unsignedInteger();
  return number.isNumber() ? static_cast<std::uint64_t>(number.asInteger()) : KVRDevice::kLocal;
}

}  // namespace

KVRDevice::KVRDevice(std::optional<std::string> theName, std::optional<std::string> theSerialNumber,
                     std::optional<Date> theActivationDate, std::uint64_t theDeviceType)
    : name(std::move(theName)),
      serialNumber(std::move(theSerialNumber)),
      activationDate(theActivationDate),
      deviceType(theDeviceType) {}

std::shared_ptr<KVRDevice> KVRDevice::deviceWithName(std::optional<std::string> name,
                                                     std::optional<std::string> serialNumber,
                                                     std::optional<Date> activationDate,
                                                     std::uint64_t deviceType) {
  return std::make_shared<KVRDevice>(std::move(name), std::move(serialNumber), activationDate, deviceType);
}

std::shared_ptr<KVRDevice> KVRDevice::initWithCoder(const Value& coded) {
  return deviceWithName(coded[kName].stringIfAny(), coded[kSerialNumber].stringIfAny(),
                        coded[kActivationDate].dateIfAny(), typeFrom(coded[kDeviceType]));
}

Value KVRDevice::encodeWithCoder() const {
  Value::Dictionary coded;
  if (auto text = name()) coded.emplace(kName, *std::move(text));
  if (auto text = serialNumber()) coded.emplace(kSerialNumber, *std::move(text));
  if (const auto date = activationDate()) coded.emplace(kActivationDate, *date);
  coded.emplace(kDeviceType, deviceType());
  return coded;
}

const char* KVRDevice::deviceTypeString() const {
  switch (deviceType()) {
    case kWatch:
      return "Watch";
    case kOther:
      return "Other";
    default:
      return "Default";
  }
}

std::string KVRDevice::description() const {
  return format("%@ (%@) (%@) - %@", name(), serialNumber(), activationDate(), deviceTypeString());
}

}  // namespace kvr
