#pragma once

#include <algorithm>
#include <chrono>
#include <cmath>

namespace kvr {

/// The time `seconds` from now on the monotonic clock, rounded up. Negative values and NaN count as 0; values
/// are limited to about a century.
inline std::chrono::steady_clock::time_point deadlineAfter(double seconds) {
  using Clock = std::chrono::steady_clock;
  constexpr double kLife = 3e9;
  const double limited = std::isnan(seconds) ? 0 : std::clamp(seconds, 0.0, kLife);
  return Clock::now() + std::chrono::ceil<Clock::duration>(std::chrono::duration<double>(limited));
}

}  // namespace kvr
