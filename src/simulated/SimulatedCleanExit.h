#pragma once

#include "platform/services/CleanExit.h"
#include "platform/services/Clock.h"
#include "platform/value/Date.h"

#include <vector>

namespace kvr {

/// Records the requests for a clean exit.
class SimulatedCleanExit : public CleanExit {
 public:
  explicit SimulatedCleanExit(const Clock& clock) : clock_(clock) {}

  void requestWhenIdle() override { requests.push_back(clock_.now()); }

  std::vector<Date> requests;  ///< when each was made

 private:
  const Clock& clock_;
};

}  // namespace kvr
