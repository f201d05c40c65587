#pragma once

#include <atomic>

namespace kvr {

/// The end of the process.
class CleanExit {
 public:
  virtual ~CleanExit() = default;
  /// Requests a clean exit of the process once it is idle; it is started again when it is needed. Returns at
  /// once. Any thread.
  virtual void requestWhenIdle() = 0;

  /// Whether the process is ending. Failures from then on, of a download for example, must not be taken as
  /// facts. Ask only here; the end flags inside the platform's parts are private to them. Any thread.
  bool isEnding() const { return ending_; }
  void beginEnding() { ending_ = true; }

 private:
  std::atomic<bool> ending_{false};
};

}  // namespace kvr
