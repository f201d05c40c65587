#pragma once

#include "kvr-simulate/Life.h"

#include <string>
#include <vector>

namespace kvr::simulate {

/// The fewest of these events found after which the same invariant does not hold.
std::vector<Event> minimised(std::uint64_t seed, std::vector<Event> events, double years,
                             const std::string& invariant);

}  // namespace kvr::simulate
