#include "kvr-simulate/Minimise.h"

#include <algorithm>

namespace kvr::simulate {
namespace {

constexpr int kMostLives = 400;

class Minimiser {
 public:
  Minimiser(std::uint64_t seed, double years, const std::string& invariant)
      : seed_(seed), years_(years), invariant_(invariant) {}

  /// Whether these events break the invariant; if so, keeps them as the best so far.
  bool take(std::vector<Event> events) {
    if (lives_ >= kMostLives || events.size() >= best.size()) return false;
    ++lives_;
    const auto outcome = Life(seed_, {years_, LogLevel::Error, false}).live(events);
    if (!outcome.breach || outcome.breach->invariant != invariant_) return false;
    events.resize(std::min(events.size(), *outcome.afterEvents));
    best = std::move(events);
    return true;
  }

  std::vector<Event> best;

 private:
  const std::uint64_t seed_;
  const double years_;
  const std::string& invariant_;
  int lives_ = 0;
};

}  // namespace

std::vector<Event> minimised(std::uint64_t seed, std::vector<Event> events, double years,
                             const std::string& invariant) {
  Minimiser minimiser(seed, years, invariant);
  minimiser.best = std::move(events);
  for (int kind = 0; kind <= static_cast<int>(EventKind::Setting); ++kind) {
    auto fewer = minimiser.best;
    std::erase_if(fewer, [kind](const Event& event) { return static_cast<int>(event.kind) == kind; });
    minimiser.take(std::move(fewer));
  }
  for (auto size = minimiser.best.size() / 2; size > 0; size /= 2) {
    for (std::size_t begin = 0; begin < minimiser.best.size();) {
      auto fewer = minimiser.best;
      const auto first = fewer.begin() + static_cast<std::ptrdiff_t>(begin);
      fewer.erase(first, first + static_cast<std::ptrdiff_t>(std::min(size, fewer.size() - begin)));
      if (!minimiser.take(std::move(fewer))) begin += size;
    }
  }
  return minimiser.best;
}

}  // namespace kvr::simulate
