#pragma once

#include "platform/services/PairedDeviceRegistry.h"

#include <algorithm>
#include <iterator>

namespace kvr {

class SimulatedPairedDeviceRegistry : public PairedDeviceRegistry {
 public:
  std::vector<PairedDeviceEntry> devices;

  std::vector<PairedDeviceEntry> allDevicesPassing(const Predicate& predicate) const override {
    std::vector<PairedDeviceEntry> passing;
    std::copy_if(devices.begin(), devices.end(), std::back_inserter(passing), predicate);
    return passing;
  }
};

}  // namespace kvr
