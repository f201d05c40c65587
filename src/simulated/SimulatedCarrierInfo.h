#pragma once

#include "platform/services/CarrierInfo.h"

namespace kvr {

class SimulatedCarrierInfo : public CarrierInfo {
 public:
  std::map<std::string, Carrier> carriers;  ///< by subscription

  std::map<std::string, Carrier> subscriptions() const override { return carriers; }
};

}  // namespace kvr
