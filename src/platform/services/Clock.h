#pragma once

#include "platform/value/Date.h"

namespace kvr {

/// The wall clock. It may be moved, forward and back, at any time; waits are measured by `WorkQueues`.
class Clock {
 public:
  virtual ~Clock() = default;
  virtual Date now() const = 0;
};

}  // namespace kvr
