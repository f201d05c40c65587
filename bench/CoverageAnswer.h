#pragma once

#include <string>

namespace kvr::bench {

/// An answer of the coverage service as they come: 60 keys, about 6 kB of JSON.
std::string coverageAnswer();

}  // namespace kvr::bench
