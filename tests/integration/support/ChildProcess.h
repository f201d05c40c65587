#pragma once

#include "local/system/Descriptor.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <map>
#include <mutex>
#include <stdexcept>
#include <string>
#include <string_view>
#include <system_error>
#include <thread>
#include <vector>

namespace kvr::testing {

/// A program run as a child process; keeps its output, and kills it in the destructor.
///
/// Each wait throws an exception with the child's output after a generous limit, so that a hanging child
/// fails the test instead of blocking the test run.
class ChildProcess {
 public:
  using Environment = std::map<std::string, std::string>;

  /// Starts `arguments[0]`, an absolute path or a program in PATH, with this process's environment changed by
  /// `changes`; an empty value removes a variable.
  explicit ChildProcess(std::vector<std::string> arguments, const Environment& changes = {})
      : name_(arguments.at(0)) {
    std::vector<std::string> environment = environmentWith(changes);
    const std::vector<char*> argumentPointers = pointersTo(arguments);
    const std::vector<char*> environmentPointers = pointersTo(environment);
    auto output = newPipe();
    auto errors = newPipe();
    const pid_t parent = ::getpid();
    pid_ = ::fork();
    if (pid_ < 0) fail("fork");
    if (pid_ == 0) {
      // The child must not outlive a test that crashes.
      ::prctl(PR_SET_PDEATHSIG, SIGKILL);
      if (::getppid() != parent) ::_exit(127);
      ::dup2(output.second.get(), STDOUT_FILENO);
      ::dup2(errors.second.get(), STDERR_FILENO);
      ::execvpe(argumentPointers[0], argumentPointers.data(), environmentPointers.data());
      ::_exit(127);
    }
    outputs_[0] = std::move(output.first);
    outputs_[1] = std::move(errors.first);
    process_ = Descriptor(static_cast<int>(::syscall(SYS_pidfd_open, pid_, 0)));
    stop_ = Descriptor(::eventfd(0, EFD_CLOEXEC));
    if (!process_ || !stop_) fail("pidfd_open");
    reader_ = std::thread([this] { readOutput(); });
  }
  ~ChildProcess() {
    if (!reaped_ && ::kill(pid_, SIGKILL) == 0) ::waitpid(pid_, nullptr, 0);
    // A process started by the child may still hold the pipes open.
    const std::uint64_t one = 1;
    if (::write(stop_.get(), &one, sizeof one) != sizeof one) std::terminate();
    reader_.join();
  }

  pid_t pid() const { return pid_; }
  /// The output so far.
  std::string output() const {
    const std::lock_guard lock(mutex_);
    return output_;
  }
  std::string errorOutput() const {
    const std::lock_guard lock(mutex_);
    return errorOutput_;
  }
  /// Wait until a whole line that contains `text` has been printed, from byte `from` on; return it without
  /// its line break.
  std::string waitForOutput(std::string_view text, std::size_t from = 0) {
    return waitFor(output_, text, from);
  }
  std::string waitForErrorOutput(std::string_view text, std::size_t from = 0) {
    return waitFor(errorOutput_, text, from);
  }

  void send(int signal) const {
    if (::syscall(SYS_pidfd_send_signal, process_.get(), signal, nullptr, 0) < 0) fail("pidfd_send_signal");
  }
  /// Waits for the end; returns the exit status, or minus the number of the signal that ended it. All output
  /// has been read by then.
  int wait() {
    if (reaped_) return status_;
    pollfd process{process_.get(), POLLIN, 0};
    const int milliseconds = static_cast<int>(std::chrono::milliseconds(kLimit).count());
    const int ready = ::poll(&process, 1, milliseconds);
    std::unique_lock lock(mutex_);
    if (ready != 1) giveUp(" did not end");
    int status = 0;
    ::waitpid(pid_, &status, 0);
    reaped_ = true;
    status_ = WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
    changed_.wait_for(lock, kLimit, [this] { return closed_; });
    return status_;
  }
  int terminate() {
    if (!reaped_) send(SIGTERM);
    return wait();
  }
  int kill() {
    if (!reaped_) send(SIGKILL);
    return wait();
  }

 private:
  /// Long enough for the slowest machine under a sanitizer; only a failing test waits this long.
  static constexpr std::chrono::seconds kLimit{60};

  [[noreturn]] static void fail(const char* what) {
    throw std::system_error(errno, std::generic_category(), what);
  }
  /// The read end and the write end.
  static std::pair<Descriptor, Descriptor> newPipe() {
    std::array<int, 2> ends{};
    if (::pipe2(ends.data(), O_CLOEXEC) < 0) fail("pipe2");
    return {Descriptor(ends[0]), Descriptor(ends[1])};
  }
  static std::vector<std::string> environmentWith(const Environment& changes) {
    std::vector<std::string> result;
    for (char** entry = environ; *entry; ++entry) {
      const std::string_view text = *entry;
      if (!changes.contains(std::string(text.substr(0, text.find('='))))) result.emplace_back(text);
    }
    for (const auto& [name, value] : changes) {
      if (!value.empty()) result.emplace_back(name).append("=").append(value);
    }
    return result;
  }
  static std::vector<char*> pointersTo(std::vector<std::string>& texts) {
    std::vector<char*> result;
    for (std::string& text : texts) result.push_back(text.data());
    result.push_back(nullptr);
    return result;
  }
  void readOutput() {
    std::array<pollfd, 3> sources{pollfd{outputs_[0].get(), POLLIN, 0}, pollfd{outputs_[1].get(), POLLIN, 0},
                                  pollfd{stop_.get(), POLLIN, 0}};
    std::array<char, 65536> buffer{};
    while ((sources[0].fd >= 0 || sources[1].fd >= 0) && !sources[2].revents) {
      if (::poll(sources.data(), sources.size(), -1) < 0 && errno != EINTR) break;
      for (std::size_t i = 0; i < 2; ++i) {
        if (!sources[i].revents) continue;
        const ssize_t count = ::read(sources[i].fd, buffer.data(), buffer.size());
        if (count <= 0) sources[i].fd = -1;
        const std::lock_guard lock(mutex_);
        if (count > 0)
          (i == 0 ? output_ : errorOutput_).append(buffer.data(), static_cast<std::size_t>(count));
        changed_.notify_all();
      }
    }
    const std::lock_guard lock(mutex_);
    closed_ = true;
    changed_.notify_all();
  }
  std::string waitFor(const std::string& stream, std::string_view text, std::size_t from) {
    std::unique_lock lock(mutex_);
    std::string line;
    const auto found = [&] {
      const auto at = stream.find(text, from);
      const auto end = stream.find('\n', at);
      if (end == std::string::npos) return false;
      const auto begin = stream.rfind('\n', at) + 1;  // of the first line it finds npos
      line = stream.substr(begin, end - begin);
      return true;
    };
    bool seen = false;
    changed_.wait_for(lock, kLimit, [&] { return (seen = found()) || closed_; });
    if (!seen) giveUp(" never printed \"" + std::string(text) + "\"");
    return line;
  }
  [[noreturn]] void giveUp(const std::string& why) const {
    throw std::runtime_error(name_ + why + "; standard output:\n" + output_ + "\nstandard error:\n" +
                             errorOutput_);
  }

  const std::string name_;
  pid_t pid_ = -1;
  Descriptor outputs_[2];  ///< its standard output and standard error
  Descriptor process_;
  Descriptor stop_;
  mutable std::mutex mutex_;  ///< guards what follows
  std::condition_variable changed_;
  std::string output_;
  std::string errorOutput_;
  bool closed_ = false;
  bool reaped_ = false;
  int status_ = 0;
  std::thread reader_;
};

}  // namespace kvr::testing
