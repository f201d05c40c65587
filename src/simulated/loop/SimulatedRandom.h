#pragma once

#include "platform/services/Random.h"

#include <cstdint>
#include <cstdio>
#include <random>

namespace kvr {

/// Version 4 UUIDs; the same seed gives the same ones.
class SimulatedRandom : public Random {
 public:
  explicit SimulatedRandom(std::uint64_t seed) : random_(seed) {}

  std::string uuid() override {
    const std::uint64_t high = random_();
    const std::uint64_t low = random_();
    char text[37];
    std::snprintf(text, sizeof text, "%08X-%04X-4%03X-%04X-%04X%08X", static_cast<unsigned>(high >> 32U),
                  static_cast<unsigned>(high >> 16U & 0xFFFFU), static_cast<unsigned>(high & 0xFFFU),
                  static_cast<unsigned>(0x8000U | (low >> 48U & 0x3FFFU)),
                  static_cast<unsigned>(low >> 32U & 0xFFFFU), static_cast<unsigned>(low));
    return text;
  }

 private:
  std::mt19937_64 random_;
};

}  // namespace kvr
