#pragma once

#include <chrono>
#include <functional>
#include <string>
#include <vector>

namespace kvr::bench {

using Clock = std::chrono::steady_clock;

inline constexpr int kRounds = 9;

/// The seconds that `work` takes.
double secondsOf(const std::function<void()>& work);
/// The value at a quantile (0.5 is the median).
double quantile(std::vector<double> values, double fraction);

/// One measure of both programs, one value per round.
struct Series {
  std::vector<double> agent;
  std::vector<double> bare;
};

/// How a figure is shown: value times `scale` is the number shown, in `unit`.
struct Presentation {
  std::string figure;
  std::string goal;
  std::string unit;
  double scale = 1;
  int digits = 1;
};

/// Runs agent and bare alternately, `kRounds` times each, after one warm-up round each.
Series inTurns(const std::function<double()>& agent, const std::function<double()>& bare);
/// The same for rounds that give several measures, such as two quantiles.
std::vector<Series> inTurns(std::size_t measures, const std::function<std::vector<double>()>& agent,
                            const std::function<std::vector<double>()>& bare);

/// Prints a row of the table: median and spread of both, and the ratio of the medians.
void printRow(const Presentation& how, const Series& series);
/// A row of texts.
void printRow(const std::string& figure, const std::string& agent, const std::string& bare,
              const std::string& ratio, const std::string& goal);
/// "12.3 µs (11.0–15.2)"
std::string shown(const Presentation& how, const std::vector<double>& values);
std::string number(double value, int digits);

}  // namespace kvr::bench
