#pragma once

#include <chrono>
#include <functional>
#include <string>
#include <vector>

namespace kvr::bench {

using Clock = std::chrono::steady_clock;

inline constexpr int kRounds = 9;

/// Seconds that `work` takes.
double secondsOf(const std::function<void()>& work);
/// The value at a fraction (0.5 the median) of what was measured.
double quantile(std::vector<double> values, double fraction);

/// One measure of both sides, a value a round.
struct Series {
  std::vector<double> agent;
  std::vector<double> bare;
};

/// How a figure is shown. `scale` makes the shown number of a value, in `unit`.
struct Presentation {
  std::string figure;
  std::string goal;
  std::string unit;
  double scale = 1;
  int digits = 1;
};

/// Runs agent and bare in turn, `kRounds` times, after one round of each that does not count.
Series inTurns(const std::function<double()>& agent, const std::function<double()>& bare);
/// The same for rounds that give several measures at once, such as two quantiles.
std::vector<Series> inTurns(std::size_t measures, const std::function<std::vector<double>()>& agent,
                            const std::function<std::vector<double>()>& bare);

/// Prints a row of the table: median and spread of both, and the ratio of the medians.
void printRow(const Presentation& how, const Series& series);
/// A row whose columns are texts.
void printRow(const std::string& figure, const std::string& agent, const std::string& bare,
              const std::string& ratio, const std::string& goal);
/// "12.3 µs (11.0–15.2)"
std::string shown(const Presentation& how, const std::vector<double>& values);
std::string number(double value, int digits);

}  // namespace kvr::bench
