// kvr-bench [FIGURE...]: measures the given figures, by default all, and prints at least one row for each.

#include "Figures.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <string_view>
#include <vector>

namespace {

struct Figure {
  std::string_view name;
  void (*measure)();
};

constexpr Figure kFigures[] = {
    {"lookup", kvr::bench::lookUp},   {"inflight", kvr::bench::manyInFlight},
    {"first", kvr::bench::firstCall}, {"start", kvr::bench::start},
    {"memory", kvr::bench::memory},   {"growth", kvr::bench::growth},
    {"wakeups", kvr::bench::wakeUps}, {"store", kvr::bench::store},
    {"request", kvr::bench::request}, {"refresh", kvr::bench::refresh},
    {"infos", kvr::bench::allInfos},  {"codecs", kvr::bench::codecs},
};

}  // namespace

int main(int argumentCount, char** arguments) {
  std::vector<std::string_view> wanted(arguments + 1, arguments + argumentCount);
  for (const auto name : wanted) {
    if (std::ranges::find(kFigures, name, &Figure::name) != std::end(kFigures)) continue;
    std::fprintf(stderr, "kvr-bench: no figure is called %.*s; there are:", static_cast<int>(name.size()),
                 name.data());
    for (const auto& figure : kFigures) std::fprintf(stderr, " %s", figure.name.data());
    std::fprintf(stderr, "\n");
    return EXIT_FAILURE;
  }
  try {
    for (const auto& figure : kFigures) {
      if (wanted.empty() || std::ranges::find(wanted, figure.name) != wanted.end()) figure.measure();
    }
    return EXIT_SUCCESS;
  } catch (const std::exception& error) {
    std::fprintf(stderr, "kvr-bench: %s\n", error.what());
    return EXIT_FAILURE;
  }
}
