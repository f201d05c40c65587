#pragma once

#include "platform/services/Observers.h"

#include <vector>

namespace kvr {

/// Observers that remember what they were told.
class SimulatedObservers : public Observers {
 public:
  bool areThere() const override { return are; }
  void tell(const Change& change) override { told.push_back(change); }

  bool are = false;
  std::vector<Change> told;
};

}  // namespace kvr
