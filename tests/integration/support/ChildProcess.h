#pragma once

#include "platform/local/Descriptor.h"

#include <sys/types.h>

#include <condition_variable>
#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

namespace kvr::testing {

/// A program run as a child; what it prints is kept. Killed at the end if it still runs.
///
/// Every wait ends with an exception that tells what the child printed once a generous limit has passed, so
/// that a child that hangs is a failure and not a stuck test run.
class ChildProcess {
 public:
  using Environment = std::map<std::string, std::string>;

  /// Starts `arguments[0]`, an absolute path or one found in PATH. The environment is this process's own with
  /// `changes` on top; an empty value takes the variable away.
  explicit ChildProcess(std::vector<std::string> arguments, const Environment& changes = {});
  ~ChildProcess();
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  pid_t pid() const { return pid_; }
  /// What was printed so far.
  std::string output() const;
  std::string errorOutput() const;
  /// Wait until a whole line holding `text` has been printed from byte `from` on, and return it without its
  /// line break.
  std::string waitForOutput(std::string_view text, std::size_t from = 0);
  std::string waitForErrorOutput(std::string_view text, std::size_t from = 0);

  void send(int signal) const;
  /// Waits for the end and returns the exit status, or minus the signal that ended it. All it printed has
  /// been read by then.
  int wait();
  int terminate();
  int kill();

 private:
  void readOutput();
  std::string waitFor(const std::string& stream, std::string_view text, std::size_t from);
  std::string printed() const;

  const std::string name_;
  pid_t pid_ = -1;
  Descriptor outputs_[2];  ///< what it prints, and prints as errors
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
