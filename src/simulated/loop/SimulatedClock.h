#pragma once

#include "platform/services/Clock.h"

#include <functional>
#include <utility>

namespace kvr {

/// The two clocks of the simulation: virtual time, which only `SimulatedWorkQueues` advances, and the wall
/// clock, which follows it and can also be set, like a device's clock.
class SimulatedClock : public Clock {
 public:
  static constexpr Date kDefaultStart{1'790'000'000};  // 2026-09-21 14:13:20 UTC

  explicit SimulatedClock(Date start = kDefaultStart) : base_(start) {}

  Date now() const override { return base_ + elapsed_; }
  /// Sets the wall clock; delays and waits under way are not affected.
  void set(Date now) { moveTo(now - elapsed_); }
  void moveBy(double seconds) { moveTo(base_ + seconds); }
  /// Sets the one function that is called when the wall clock is set; empty for none.
  void whenMoved(std::function<void()> moved) { moved_ = std::move(moved); }

  /// Virtual seconds since the simulation began.
  double elapsed() const { return elapsed_; }

 private:
  friend class SimulatedWorkQueues;

  void moveTo(Date base) {
    base_ = base;
    if (moved_) moved_();
  }

  Date base_;  ///< the wall-clock time at the beginning, by the present setting
  double elapsed_ = 0;
  std::function<void()> moved_;
};

}  // namespace kvr
