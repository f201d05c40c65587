#include "Measurement.h"

#include <algorithm>
#include <cmath>
#include <cstdio>

namespace kvr::bench {

double secondsOf(const std::function<void()>& work) {
  const auto start = Clock::now();
  work();
  return std::chrono::duration<double>(Clock::now() - start).count();
}

double quantile(std::vector<double> values, double fraction) {
  std::ranges::sort(values);
  const auto last = static_cast<double>(values.size() - 1);
  return values.at(static_cast<std::size_t>(std::lround(fraction * last)));
}

Series inTurns(const std::function<double()>& agent, const std::function<double()>& bare) {
  return inTurns(
             1, [&] { return std::vector{agent()}; }, [&] { return std::vector{bare()}; })
      .front();
}

std::vector<Series> inTurns(std::size_t measures, const std::function<std::vector<double>()>& agent,
                            const std::function<std::vector<double>()>& bare) {
  std::vector<Series> series(measures);
  agent();
  bare();
  for (int round = 0; round < kRounds; ++round) {
    const auto ours = agent();
    const auto theirs = bare();
    for (std::size_t i = 0; i < measures; ++i) {
      series[i].agent.push_back(ours.at(i));
      series[i].bare.push_back(theirs.at(i));
    }
  }
  return series;
}

std::string number(double value, int digits) {
  char text[64];
  std::snprintf(text, sizeof text, "%.*f", digits, value);
  return text;
}

std::string shown(const Presentation& how, const std::vector<double>& values) {
  const auto at = [&](double fraction) { return number(quantile(values, fraction) * how.scale, how.digits); };
  std::string text = at(0.5);
  if (!how.unit.empty()) text.append(" ").append(how.unit);
  if (values.size() > 1) text.append(" (").append(at(0)).append("–").append(at(1)).append(")");
  return text;
}

void printRow(const Presentation& how, const Series& series) {
  const double ratio = quantile(series.agent, 0.5) / quantile(series.bare, 0.5);
  printRow(how.figure, shown(how, series.agent), shown(how, series.bare), number(ratio, 2), how.goal);
}

void printRow(const std::string& figure, const std::string& agent, const std::string& bare,
              const std::string& ratio, const std::string& goal) {
  std::printf("| %s | %s | %s | %s | %s |\n", figure.c_str(), agent.c_str(), bare.c_str(), ratio.c_str(),
              goal.c_str());
  std::fflush(stdout);
}

}  // namespace kvr::bench
