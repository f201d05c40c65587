#pragma once

namespace kvr {

class CleanExit {
 public:
  virtual ~CleanExit() = default;
  /// Has the process ended cleanly once it is idle; it is started again when it is needed. Returns at once.
  /// Any thread.
  virtual void requestWhenIdle() = 0;
};

}  // namespace kvr
