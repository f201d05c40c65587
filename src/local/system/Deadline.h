#pragma once

#include <algorithm>
#include <chrono>
#include <cmath>

namespace kvr {

/// The moment `seconds` from now on the clock that nobody can set, rounded up. Below zero is now, as is what
/// is no number; more than a human life is one.
inline std::chrono::steady_clock::time_point deadlineAfter(double seconds) {
  using Clock = std::chrono::steady_clock;
  constexpr double kLife = 3e9;
  const double limited = std::isnan(seconds) ? 0 : std::clamp(seconds, 0.0, kLife);
  return Clock::now() + std::chrono::ceil<Clock::duration>(std::chrono::duration<double>(limited));
}

}  // namespace kvr
