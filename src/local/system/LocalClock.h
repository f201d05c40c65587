#pragma once

#include "platform/services/Clock.h"

namespace kvr {

/// The system's wall clock.
class LocalClock : public Clock {
 public:
  Date now() const override;
};

}  // namespace kvr
