#pragma once

#include "client/AgentConnection.h"
#include "client/kvrctl/Commands.h"
#include "local/loop/EventLoop.h"

#include <functional>

namespace kvr::client {

/// What the agent tells of changes, in a loop. Built and destroyed on the loop's thread.
class ChangesInLoop {
 public:
  /// Whatever goes wrong is not told; without an agent there is nothing to tell.
  ChangesInLoop(EventLoop& loop, AgentConnection connection, std::function<void(const Change&)> changed);
  ~ChangesInLoop();
  ChangesInLoop(const ChangesInLoop&) = delete;
  ChangesInLoop& operator=(const ChangesInLoop&) = delete;

 private:
  int prepare();
  int dispatch();

  AgentConnection connection_;
  sd_event_source* descriptor_ = nullptr;
  sd_event_source* timer_ = nullptr;
};

/// The loop's status when nobody can read the standard output any more; no other end of a loop has it.
constexpr int kOutputGone = 77;
/// Ends the loop with that status then.
void endWithOutput(EventLoop& loop);

/// The status of all devices, again whenever it changes. Ends when the agent refuses this program, when the
/// bus goes, and when nobody reads the output any more.
Status watchStatus(const Options& options);

}  // namespace kvr::client
