#pragma once

#include "platform/services/Random.h"

namespace kvr {

/// The kernel's random numbers.
class LocalRandom : public Random {
 public:
  std::string uuid() override;
};

}  // namespace kvr
