#pragma once

#include "platform/services/Clock.h"

#include <functional>
#include <utility>

namespace kvr {

/// The two clocks of the simulation: virtual time, which only `SimulatedWorkQueues` moves, and the wall
/// clock, which follows it and can be set besides, like a device's clock.
class SimulatedClock : public Clock {
 public:
  static constexpr Date kDefaultStart{1'790'000'000};  // 2026-09-21 14:13:20 UTC

  explicit SimulatedClock(Date start = kDefaultStart) : base_(start) {}

  Date now() const override { return base_ + elapsed_; }
  /// Moves the wall clock; delays and waits under way are not touched.
  void set(Date now) { moveTo(now - elapsed_); }
  void moveBy(double seconds) { moveTo(base_ + seconds); }
  /// What is to happen when the wall clock is moved; one thing, or nothing.
  void whenMoved(std::function<void()> moved) { moved_ = std::move(moved); }

  /// Virtual seconds since the simulation began.
  double elapsed() const { return elapsed_; }

 private:
  friend class SimulatedWorkQueues;

  void moveTo(Date base) {
    base_ = base;
    if (moved_) moved_();
  }

  Date base_;  ///< what the wall clock showed, by its present setting, at the beginning
  double elapsed_ = 0;
  std::function<void()> moved_;
};

}  // namespace kvr
