#include "local/system/LocalClock.h"

#include <time.h>

namespace kvr {

Date LocalClock::now() const {
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME, &now);
  return {static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9};
}

}  // namespace kvr
