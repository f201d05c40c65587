#pragma once

#include "platform/value/Date.h"

namespace kvr {

/// The wall clock. It can be set forward and back at any time; use `WorkQueues` to measure waits.
class Clock {
 public:
  virtual ~Clock() = default;
  virtual Date now() const = 0;
};

}  // namespace kvr
