// Simulates whole lives of the agent, each from a seed, and checks that the invariants hold.

#include "kvr-simulate/Minimise.h"

#include <CLI/CLI.hpp>

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <fstream>
#include <map>
#include <mutex>
#include <numeric>
#include <sstream>
#include <thread>

namespace kvr::simulate {
namespace {

struct Arguments {
  std::uint64_t first = 1;
  std::uint64_t count = 200;
  std::string listed;  ///< the file that lists the seeds; empty if they are consecutive
  double years = 1;
  unsigned jobs = std::max(std::thread::hardware_concurrency(), 1U);
  std::vector<std::size_t> only;
  bool isTraced = false;
  bool isWithoutEvents = false;
  bool isBrief = false;
  bool goesOn = false;
};

/// For some seeds everything is logged, so that the formatting of log lines is exercised too.
constexpr std::uint64_t kLoggedSeeds = 8;

LogLevel levelFor(std::uint64_t seed) { return seed % kLoggedSeeds == 0 ? LogLevel::Debug : LogLevel::Error; }

std::vector<Event> eventsFor(std::uint64_t seed, const Arguments& arguments) {
  if (arguments.isWithoutEvents) return {};
  auto events = eventsOf(seed, arguments.years);
  if (!arguments.only.empty()) {
    std::erase_if(events, [&](const Event& event) {
      return std::ranges::find(arguments.only, event.number) == arguments.only.end();
    });
  }
  return events;
}

/// The seeds in a file: one in a line, before an optional comment from '#' on.
std::vector<std::uint64_t> seedsIn(const std::string& path) {
  std::ifstream file(path);
  std::vector<std::uint64_t> seeds;
  for (std::string line; std::getline(file, line);) {
    std::istringstream words(line.substr(0, line.find('#')));
    for (std::uint64_t seed = 0; words >> seed;) seeds.push_back(seed);
    if (!words.eof())
      throw CLI::ValidationError("--seeds-of", std::string(path).append(": no seed: ").append(line));
  }
  if (seeds.empty()) throw CLI::ValidationError("--seeds-of", path + ": no seeds");
  return seeds;
}

std::vector<std::uint64_t> seedsOf(const Arguments& arguments) {
  if (!arguments.listed.empty()) return seedsIn(arguments.listed);
  std::vector<std::uint64_t> seeds(arguments.count);
  std::iota(seeds.begin(), seeds.end(), arguments.first);
  return seeds;
}

void explain(std::uint64_t seed, const Arguments& arguments, const Outcome& outcome) {
  auto events = eventsFor(seed, arguments);
  events.resize(std::min(events.size(), outcome.afterEvents.value_or(events.size())));
  std::printf("seed %llu: \"%s\" does not hold: %s\n  after %zu events, %.1f days\n",
              static_cast<unsigned long long>(seed), outcome.breach->invariant.c_str(),
              outcome.breach->detail.c_str(), events.size(), outcome.at / 86400);
  std::fflush(stdout);
  if (arguments.isBrief) return;
  const auto fewest = minimised(seed, std::move(events), arguments.years, outcome.breach->invariant);
  const auto again = Life(seed, {arguments.years, LogLevel::Debug, false}).live(fewest);
  std::string numbers;
  for (const auto& event : fewest) numbers += (numbers.empty() ? "" : ",") + std::to_string(event.number);
  std::printf("  the last lines of its log:\n");
  const auto& lines = again.lastLines;
  for (auto line = lines.size() > 30 ? lines.end() - 30 : lines.begin(); line != lines.end(); ++line) {
    std::printf("    %.300s\n", line->c_str());
  }
  std::printf("  again, with %zu events:\n    kvr-simulate --first %llu --seeds 1 --years %g %s --trace\n",
              fewest.size(), static_cast<unsigned long long>(seed), arguments.years,
              numbers.empty() ? "--none" : ("--only " + numbers).c_str());
  std::fflush(stdout);
}

int simulate(const Arguments& arguments, const std::vector<std::uint64_t>& seeds) {
  std::mutex mutex;  // guards what follows
  Figures figures;
  std::map<std::uint64_t, Outcome> broken;
  std::atomic<std::size_t> next{0};
  const auto work = [&] {
    for (auto index = next++; index < seeds.size(); index = next++) {
      const auto seed = seeds[index];
      const Life::Options options{arguments.years, arguments.isTraced ? LogLevel::Debug : levelFor(seed),
                                  arguments.isTraced};
      const auto events = eventsFor(seed, arguments);
      auto outcome = Life(seed, options).live(events);
      if (index == 0 && !outcome.breach && Life(seed, options).live(events).digest != outcome.digest) {
        outcome.breach = Breach{"the same seed is the same life", "it was not"};
      }
      const std::lock_guard lock(mutex);
      figures.add(outcome.figures);
      if (!outcome.breach) continue;
      broken.emplace(seed, std::move(outcome));
      if (!arguments.goesOn) next = seeds.size();
    }
  };
  std::vector<std::thread> threads;
  for (unsigned job = 0; job < arguments.jobs; ++job) threads.emplace_back(work);
  for (auto& thread : threads) thread.join();
  std::printf(
      "%zu seeds of %g years: %zu starts, %zu crashes, %zu losses of power, %zu calls, %zu requests, "
      "%zu posts, %zu clock jumps, %zu file faults, %zu runs of activities, %zu switches in the middle of "
      "work\n",
      seeds.size(), arguments.years, figures.starts, figures.crashes, figures.powerLosses, figures.calls,
      figures.requests, figures.posts, figures.clockJumps, figures.fileFaults, figures.runs, figures.pauses);
  if (broken.empty()) return EXIT_SUCCESS;
  for (const auto& [seed, outcome] : broken) {
    explain(seed, arguments, outcome);
    if (!arguments.goesOn) break;
  }
  return EXIT_FAILURE;
}

}  // namespace
}  // namespace kvr::simulate

int main(int count, char** texts) {
  kvr::simulate::Arguments arguments;
  CLI::App app("Lives whole lives of the agent in virtual time and checks what must always hold.");
  app.add_option("--seeds", arguments.count, "how many lives");
  app.add_option("--seeds-of", arguments.listed, "the file that lists the seeds of the lives");
  app.add_option("--years", arguments.years, "how long each is");
  app.add_option("--first", arguments.first, "the first life's seed");
  app.add_option("--jobs", arguments.jobs, "how many are lived at once");
  app.add_option("--only", arguments.only, "the numbers of the only events that happen")->delimiter(',');
  app.add_flag("--none", arguments.isWithoutEvents, "let nothing happen");
  app.add_flag("--brief", arguments.isBrief, "do not look for the shortest way to see a failure again");
  app.add_flag("--go-on", arguments.goesOn, "do not stop at the first failure");
  app.add_flag("--trace", arguments.isTraced, "print what happens");
  try {
    app.parse(count, texts);
    if (arguments.isTraced) arguments.jobs = 1;
    return kvr::simulate::simulate(arguments, kvr::simulate::seedsOf(arguments));
  } catch (const CLI::Error& error) {
    return app.exit(error);
  }
}
