#pragma once

#include <string>

namespace kvr::bench {

/// A typical answer of the coverage service: 60 keys, about 6 kB of JSON.
std::string coverageAnswer();

}  // namespace kvr::bench
