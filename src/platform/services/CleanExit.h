#pragma once

#include <atomic>

namespace kvr {

/// The end of the process.
class CleanExit {
 public:
  virtual ~CleanExit() = default;
  /// Has the process ended cleanly once it is idle; it is started again when it is needed. Returns at once.
  /// Any thread.
  virtual void requestWhenIdle() = 0;

  /// Whether the process is ending: what fails from here on, a download for one, says nothing about the
  /// world. This is the one answer; what the platform's own parts keep of their ends is nobody else's
  /// business. Any thread.
  bool isEnding() const { return ending_; }
  void beginEnding() { ending_ = true; }

 private:
  std::atomic<bool> ending_{false};
};

}  // namespace kvr
