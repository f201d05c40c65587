#pragma once

#include "platform/Clock.h"

namespace kvr {

/// The two clocks of the simulation: virtual time, which only `SimulatedWorkQueues` moves, and the wall
/// clock, which follows it and can be set besides, like a device's clock.
class SimulatedClock : public Clock {
 public:
  static constexpr Date kDefaultStart{1'790'000'000};  // 2026-09-21 14:13:20 UTC

  explicit SimulatedClock(Date start = kDefaultStart) : base_(start) {}

  Date now() const override { return base_ + elapsed_; }
  /// Moves the wall clock; delays and waits under way are not touched.
  void set(Date now) { base_ = now - elapsed_; }
  void moveBy(double seconds) { base_ = base_ + seconds; }

  /// Virtual seconds since the simulation began.
  double elapsed() const { return elapsed_; }

 private:
  friend class SimulatedWorkQueues;

  Date base_;  ///< what the wall clock showed, by its present setting, at the beginning
  double elapsed_ = 0;
};

}  // namespace kvr
