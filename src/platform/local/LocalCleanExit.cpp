#include "platform/local/LocalCleanExit.h"

#include "platform/local/Descriptor.h"

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
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

// Between two looks, in seconds: from the first to the last.
constexpr double kFirstPatience = 0.05;
constexpr double kLongestPatience = 10;

/// Whether this very process is one that a service manager started, which starts it again after a clean exit.
bool isManagedService() {
  const char* const process = std::getenv("SYSTEMD_EXEC_PID");
  return process != nullptr && process == std::to_string(::getpid());
}

/// A program beside this one.
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

/// Leaves a process behind that has the bus start the next agent for what no client asks for, and is watching
/// when this returns.
bool LocalCleanExit::leaveWaker() {
  const auto fail = [this](int reason) {
    log_.error("no clean exit, %@ cannot be left behind: %@", wakerPath(),
               std::generic_category().message(reason));
    return false;
  };
  std::array<int, 2> ends{};
  if (::pipe2(ends.data(), O_CLOEXEC) < 0) return fail(errno);
  const Descriptor readEnd(ends[0]);
  Descriptor writeEnd(ends[1]);

  std::string path = wakerPath();
  const auto next = activities_.secondsToNext();
  std::string date = next ? std::to_string((clock_.now() + *next).secondsSince1970) : "never";
  const std::array<char*, 3> arguments{path.data(), date.data(), nullptr};
  posix_spawn_file_actions_t actions;
  ::posix_spawn_file_actions_init(&actions);
  ::posix_spawn_file_actions_adddup2(&actions, writeEnd.get(), STDOUT_FILENO);
  posix_spawnattr_t attributes;
  ::posix_spawnattr_init(&attributes);
  sigset_t none;
  sigemptyset(&none);
  ::posix_spawnattr_setsigmask(&attributes, &none);
  ::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSID);
  pid_t process = 0;
  const int result = ::posix_spawn(&process, path.c_str(), &actions, &attributes, arguments.data(), environ);
  ::posix_spawnattr_destroy(&attributes);
  ::posix_spawn_file_actions_destroy(&actions);
  if (result != 0) return fail(result);
  writeEnd = Descriptor();
  pollfd closed{readEnd.get(), POLLIN, 0};
  return ::poll(&closed, 1, kWakerLimit) == 1 || fail(ETIMEDOUT);
}

void LocalCleanExit::begin() {
  if (requested_) return;
  if (!wouldBeStartedAgain()) {
    log_.debug("clean exit requested; the agent stays, for nothing would start it again");
    return;
  }
  requested_ = true;
  look(kFirstPatience);
}

bool LocalCleanExit::isIdle() const {
  return activities_.runsUnderWay() == 0 && services_.openCalls() == 0 && http_.openRequests() == 0 &&
         queues_.outstanding() == 0 && loop_.delayed() == 0;
}

void LocalCleanExit::look(double patience) {
  if (isIdle() && !nameGivenUp_) {
    if (!isManagedService() && !leaveWaker()) return;
    nameGivenUp_ = true;
    services_.beginEnding();
  }
  if (isIdle() && nameGivenUp_) return loop_.exit(EXIT_SUCCESS);
  loop_.after(patience, [this, next = std::min(2 * patience, kLongestPatience)] { look(next); });
}

}  // namespace kvr
