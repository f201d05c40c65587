#pragma once

#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <random>
#include <vector>

namespace kvr::simulate {

/// Random decisions, the same on every machine for the same seed.
class Dice {
 public:
  explicit Dice(std::uint64_t seed) : random(seed) {}

  std::uint64_t number() { return random(); }
  /// From 0 to `count` - 1.
  std::size_t below(std::size_t count) { return static_cast<std::size_t>(random() % count); }
  /// From 0 to just below 1.
  double share() { return static_cast<double>(random() >> 11U) * 0x1p-53; }
  double between(double least, double most) { return least + (most - least) * share(); }
  bool happens(double probability) { return share() < probability; }
  template <class T>
  T oneOf(std::initializer_list<T> choices) {
    return *(choices.begin() + below(choices.size()));
  }
  template <class T>
  const T& oneOf(const std::vector<T>& choices) {
    return choices[below(choices.size())];
  }

  std::mt19937_64 random;
};

}  // namespace kvr::simulate
