#include "local/process/LocalCleanExit.h"

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <system_error>

namespace kvr {
namespace {

constexpr int kWakerLimit = 5000;  // milliseconds

// The time between two checks, in seconds: it doubles from the first to the longest.
constexpr double kFirstPatience = 0.05;
constexpr double kLongestPatience = 10;

/// Whether a service manager started this very process; it starts the next one after a clean exit.
bool isManagedService() {
  const char* const process = std::getenv("SYSTEMD_EXEC_PID");
  return process != nullptr && process == std::to_string(::getpid());
}

/// The path of the waker, in the same directory as this program.
std::string wakerPath() {
  std::error_code unknown;
  return (std::filesystem::read_symlink("/proc/self/exe", unknown).parent_path() / "kvragent-wake").string();
}

}  // namespace

void LocalCleanExit::requestWhenIdle() {
  loop_.post([this] { begin(); });
}

bool LocalCleanExit::wouldBeStartedAgain() {
  if (isManagedService()) return true;
  return services_.isActivatable(name_) && ::access(wakerPath().c_str(), X_OK) == 0;
}

/// Starts the waker, which has the bus start the next agent for events that no client calls for. The waker is
/// watching when this returns true, and acts once this process has ended.
bool LocalCleanExit::leaveWaker() {
  std::array<int, 2> input{};
  std::array<int, 2> output{};
  if (::pipe2(input.data(), O_CLOEXEC) < 0) return reportNoWaker(errno);
  const Descriptor childInput(input[0]);
  wakerInput_ = Descriptor(input[1]);
  if (::pipe2(output.data(), O_CLOEXEC) < 0) return reportNoWaker(errno);
  const Descriptor ownOutput(output[0]);
  Descriptor childOutput(output[1]);

  std::string path = wakerPath();
  const std::array<char*, 2> arguments{path.data(), nullptr};
  posix_spawn_file_actions_t actions;
  ::posix_spawn_file_actions_init(&actions);
  ::posix_spawn_file_actions_adddup2(&actions, childInput.get(), STDIN_FILENO);
  ::posix_spawn_file_actions_adddup2(&actions, childOutput.get(), STDOUT_FILENO);
  posix_spawnattr_t attributes;
  ::posix_spawnattr_init(&attributes);
  sigset_t none;
  sigemptyset(&none);
  ::posix_spawnattr_setsigmask(&attributes, &none);
  ::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSID);
  const int result = ::posix_spawn(&waker_, path.c_str(), &actions, &attributes, arguments.data(), environ);
  ::posix_spawnattr_destroy(&attributes);
  ::posix_spawn_file_actions_destroy(&actions);
  if (result != 0) {
    waker_ = 0;
    return reportNoWaker(result);
  }
  childOutput = Descriptor();
  pollfd ready{ownOutput.get(), POLLIN, 0};
  char byte = 0;
  if (::poll(&ready, 1, kWakerLimit) == 1 && ::read(ownOutput.get(), &byte, 1) == 1) return true;
  abandon();
  return reportNoWaker(ETIMEDOUT);
}

bool LocalCleanExit::reportNoWaker(int reason) {
  log_.error("no clean exit, %@ cannot be left behind: %@", wakerPath(),
             std::generic_category().message(reason));
  return false;
}

void LocalCleanExit::abandon() {
  if (waker_ == 0) return;
  ::kill(waker_, SIGKILL);
  ::waitpid(waker_, nullptr, 0);
  waker_ = 0;
}

void LocalCleanExit::begin() {
  if (phase_ != ExitPhase::NotRequested) return;
  if (!wouldBeStartedAgain()) {
    log_.debug("clean exit requested; the agent stays, for nothing would start it again");
    return;
  }
  phase_ = ExitPhase::WaitingForIdle;
  look(kFirstPatience);
}

bool LocalCleanExit::isIdle() const {
  return activities_.runsUnderWay() == 0 && services_.openCalls() == 0 && http_.openRequests() == 0 &&
         queues_.outstanding() == 0 && loop_.delayed() == 0;
}

void LocalCleanExit::look(double patience) {
  double next = kFirstPatience;
  switch (exitStep(phase_, isIdle(), isManagedService())) {
    case ExitStep::Wait:
      next = std::min(2 * patience, kLongestPatience);
      break;
    case ExitStep::LeaveWaker:
      if (!leaveWaker()) {
        phase_ = ExitPhase::NotRequested;
        return;
      }
      phase_ = ExitPhase::WakerWatches;
      break;
    case ExitStep::GiveUpName:
      // Activities scheduled from now on are left to the next agent.
      phase_ = ExitPhase::NameGivenUp;
      activities_.beginEnding();
      services_.beginEnding();
      break;
    case ExitStep::Leave:
      return loop_.exit(EXIT_SUCCESS);
  }
  loop_.after(patience, [this, next] { look(next); });
}

}  // namespace kvr
