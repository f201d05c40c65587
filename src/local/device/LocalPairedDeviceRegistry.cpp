#include "local/device/LocalPairedDeviceRegistry.h"

#include <utility>

namespace kvr {
namespace {

std::optional<bool> flagIn(const Value& value) {
  return value.isBool() ? std::optional(value.boolean()) : std::nullopt;
}

}  // namespace

std::vector<PairedDeviceEntry> LocalPairedDeviceRegistry::allDevicesPassing(
    const Predicate& predicate) const {
  std::vector<PairedDeviceEntry> entries;
  const auto devices = root_.array("PairedDevices.plist");
  if (!devices.isArray()) return entries;
  for (const auto& device : devices.array()) {
    if (!device.isDictionary()) continue;
    PairedDeviceEntry entry{device["name"].stringIfAny(),         device["localizedModel"].stringIfAny(),
                            device["serialNumber"].stringIfAny(), device["pairedDate"].dateIfAny(),
                            flagIn(device["isPaired"]),           flagIn(device["isArchived"])};
    if (predicate(entry)) entries.push_back(std::move(entry));
  }
  return entries;
}

}  // namespace kvr
