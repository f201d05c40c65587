#pragma once

#include "local/bus/LocalServiceListeners.h"
#include "local/http/LocalHTTP.h"
#include "local/loop/EventLoop.h"
#include "local/loop/LocalWorkQueues.h"
#include "local/process/ExitSteps.h"
#include "local/process/LocalActivityScheduler.h"
#include "local/system/Descriptor.h"
#include "platform/log/Log.h"
#include "platform/services/CleanExit.h"

#include <sys/types.h>

#include <string>

namespace kvr {

/// Ends the main loop with status 0 once nothing is under way: no call, request, activity run or delayed
/// work.
///
/// The name on the bus is released first; calls that came through it are still served, later ones start the
/// next agent. An agent that nothing would start again does not exit. It can stay, because it reads the state
/// of the device anew for each request.
class LocalCleanExit : public CleanExit {
 public:
  /// `name` is the agent's name on the bus. All arguments must outlive this. On the loop's thread.
  LocalCleanExit(EventLoop& loop, LocalWorkQueues& queues, LocalActivityScheduler& activities,
                 const LocalHTTP& http, LocalServiceListeners& services, Log& log, std::string name)
      : loop_(loop),
        queues_(queues),
        activities_(activities),
        http_(http),
        services_(services),
        log_(log),
        name_(std::move(name)) {}

  void requestWhenIdle() override;
  /// Ends the waker again, because this agent was told to end. On the loop's thread.
  void abandon();

 private:
  bool wouldBeStartedAgain();
  bool leaveWaker();
  bool reportNoWaker(int reason);
  bool isIdle() const;
  void begin();
  void look(double patience);

  EventLoop& loop_;
  LocalWorkQueues& queues_;
  LocalActivityScheduler& activities_;
  const LocalHTTP& http_;
  LocalServiceListeners& services_;
  Log& log_;
  const std::string name_;
  ExitPhase phase_ = ExitPhase::NotRequested;
  pid_t waker_ = 0;
  Descriptor wakerInput_;  ///< closed when this process ends
};

}  // namespace kvr
