// The agent's program: builds the platform of this machine, starts the agent on it and runs the main loop.

#include "core/agent/StartUp.h"
#include "local/LocalPlatform.h"
#include "local/loop/EventLoop.h"

#include <malloc.h>
#include <systemd/sd-daemon.h>
#include <systemd/sd-event.h>

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <utility>

namespace {

constexpr double kEndingLimit = 10;  // seconds
constexpr int kHeaps = 2;
constexpr int kLargeBlock = 128 * 1024;  // bytes

/// Blocks the termination signals before any thread starts, so that only the loop receives them.
void blockSignals() {
  std::signal(SIGPIPE, SIG_IGN);
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

/// Makes the C library give back what was freed. By default, threads that come and go leave a heap each, up
/// to eight for each core, and a heap keeps twice the largest block that it ever held.
void limitFreeMemory() {
  mallopt(M_ARENA_MAX, kHeaps);
  mallopt(M_MMAP_THRESHOLD, kLargeBlock);
  mallopt(M_TRIM_THRESHOLD, kLargeBlock);
}

/// Handles termination signals by ending the agent.
struct Ending {
  kvr::EventLoop& loop;
  kvr::LocalPlatform& local;

  void handleSignals() {
    const auto end = [](sd_event_source*, const signalfd_siginfo*, void* context) {
      auto& ending = *static_cast<Ending*>(context);
      ending.loop.post([&ending] {
        ending.local.cleanExit.abandon();
        ending.local.beginEnding();
        ending.loop.exit(EXIT_SUCCESS);
      });
      return 0;
    };
    for (const int signal : {SIGTERM, SIGINT}) sd_event_add_signal(loop.event(), nullptr, signal, end, this);
  }
};

/// If work does not finish in time, exits without destroying anything it may use.
void finish(kvr::LocalPlatform& local) {
  if (local.end(kEndingLimit)) return;
  local.log->error("Work did not finish within %d seconds of the end", static_cast<int>(kEndingLimit));
  std::_Exit(EXIT_FAILURE);
}

int run() {
  limitFreeMemory();
  blockSignals();
  auto log = kvr::LocalLog::fromEnvironment();
  kvr::StartUp::announce(*log);
  kvr::EventLoop loop;
  kvr::LocalPlatform local(loop, std::move(log), [&loop, &local] {
    loop.post([&loop, &local] {
      local.beginEnding();
      loop.exit(EXIT_FAILURE);
    });
  });
  Ending ending{loop, local};
  ending.handleSignals();
  int status = EXIT_FAILURE;
  try {
    const kvr::StartUp startUp(local.platform);
    sd_notify(0, "READY=1");
    status = loop.run();
    sd_notify(0, "STOPPING=1");
    finish(local);
  } catch (const std::exception& error) {
    local.log->error("The agent cannot go on: %@", std::string(error.what()));
    finish(local);
  }
  return status;
}

}  // namespace

int main() {
  try {
    return run();
  } catch (const std::exception& error) {
    std::fprintf(stderr, "kvragent: %s\n", error.what());
    return EXIT_FAILURE;
  }
}
