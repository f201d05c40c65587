#pragma once

#include "kvr-simulate/Life.h"

#include <string>
#include <vector>

namespace kvr::simulate {

/// Reduces the events to as few as it finds that still break the same invariant.
std::vector<Event> minimised(std::uint64_t seed, std::vector<Event> events, double years,
                             const std::string& invariant);

}  // namespace kvr::simulate
