// The cost of the processes: start, memory, wake-ups.

#include "Figures.h"
#include "Measurement.h"
#include "Programs.h"

#include <chrono>
#include <thread>

namespace kvr::bench {
namespace {

void waitSeconds(double seconds) { std::this_thread::sleep_for(std::chrono::duration<double>(seconds)); }

std::string kibibytes(double value) { return number(value, 0) + " KiB"; }

}  // namespace

void start() {
  Programs programs;
  // The very first start runs the migration.
  programs.startAgent();
  programs.stopAgent();
  constexpr int kStarts = 5;
  const auto median = [](const std::function<void()>& begin, const std::function<void()>& end) {
    std::vector<double> times;
    for (int i = 0; i < kStarts; ++i) {
      times.push_back(secondsOf(begin));
      end();
    }
    return quantile(times, 0.5);
  };
  printRow({"start to name owned, nothing to migrate", "≤ 2.0", "ms", 1e3, 1},
           inTurns([&] { return median([&] { programs.startAgent(); }, [&] { programs.stopAgent(); }); },
                   [&] { return median([&] { programs.startBare(); }, [&] { programs.stopBare(); }); }));
}

void memory() {
  Programs programs;
  constexpr double kRest = 1;  // seconds after the start
  const auto after = [](const std::function<void()>& begin, const std::function<pid_t()>& process) {
    begin();
    waitSeconds(kRest);
    return privateMemory(process());
  };
  const Presentation how{"private memory, idle, before the first download", "≤ 3 and ≤ 5 MiB", "KiB", 1, 0};
  printRow(how,
           inTurns([&] { return after([&] { programs.startAgent(); }, [&] { return programs.agent(); }); },
                   [&] { return after([&] { programs.startBare(); }, [&] { return programs.bare(); }); }));
}

void growth() {
  constexpr int kCalls = 100'000;
  constexpr int kDownloads = 1000;
  Programs programs;
  programs.startAgent();
  programs.fillCache();
  const RawBusClient client = programs.newClient();
  const auto work = [&](int parts) {
    for (int i = 0; i < kCalls / parts; ++i) answerTo(client, infoCall(client));
    for (int i = 0; i < kDownloads / parts; ++i) answerTo(client, infoCall(client, AgentWorld::Refresh));
  };
  work(20);  // pools and caches have their size after that
  const double before = writtenMemory(programs.agent());
  work(1);
  const double after = writtenMemory(programs.agent());
  printRow("private memory written to, after 100,000 calls and 1,000 downloads (against: after 5,000 and 50)",
           kibibytes(after), kibibytes(before), number(after / before, 2), "≤ 1.03");
}

void wakeUps() {
  constexpr double kRest =
      15;  // until the first start's work, and the wait of threads for more of it, are over
  constexpr double kWatched = 60;
  Programs programs;
  programs.startAgent();
  programs.startBare();
  waitSeconds(kRest);
  const auto ours = contextSwitches(programs.agent());
  const auto theirs = contextSwitches(programs.bare());
  waitSeconds(kWatched);
  printRow("context switches in 60 s with nothing due",
           std::to_string(contextSwitches(programs.agent()) - ours),
           std::to_string(contextSwitches(programs.bare()) - theirs), "–", "0");
}

}  // namespace kvr::bench
