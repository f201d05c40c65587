#include "core/devices/KVRDeviceInfo.h"

namespace kvr {
namespace {

constexpr const char* kDevice = "device";
constexpr const char* kWarranty = "warranty";

}  // namespace

KVRDeviceInfo::KVRDeviceInfo(KVRDeviceRef theDevice, KVRWarrantyRef theWarranty)
    : device(std::move(theDevice)), warranty(std::move(theWarranty)) {}

std::shared_ptr<KVRDeviceInfo> KVRDeviceInfo::deviceInfoWithDevice(KVRDeviceRef device,
                                                                   KVRWarrantyRef warranty) {
  return std::make_shared<KVRDeviceInfo>(std::move(device), std::move(warranty));
}

std::shared_ptr<KVRDeviceInfo> KVRDeviceInfo::initWithCoder(Platform& platform, const Value& coded) {
  const Value& codedDevice = coded[kDevice];
  return deviceInfoWithDevice(codedDevice.isDictionary() ? KVRDevice::initWithCoder(codedDevice) : nullptr,
                              KVRWarranty::initWithCoder(platform, coded[kWarranty]));
}

Value KVRDeviceInfo::encodeWithCoder() const {
  Value::Dictionary coded;
  if (const auto theDevice = device()) coded.emplace(kDevice, theDevice->encodeWithCoder());
  if (const auto theWarranty = warranty()) coded.emplace(kWarranty, theWarranty->encodeWithCoder());
  return coded;
}

bool KVRDeviceInfo::isEqual(const KVRDeviceInfo& other) const {
  const auto otherDevice = other.device();
  const auto otherWarranty = other.warranty();
  const auto ownWarranty = warranty();
  if (!otherDevice || !otherWarranty) return false;
  return device() == otherDevice && ownWarranty && ownWarranty->isEqual(*otherWarranty);
}

std::string KVRDeviceInfo::description() const {
  const auto theWarranty = warranty();
  const auto offer = theWarranty && theWarranty->zubOfferDisplay()
                         ? format("Eligible until %@", theWarranty->zubOfferEligibleUntil())
                         : "No offer";
  return format("%@: %@", device(), offer);
}

}  // namespace kvr
