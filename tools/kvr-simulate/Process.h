#pragma once

#include "core/agent/StartUp.h"
#include "kvr-simulate/Invariants.h"

#include <functional>
#include <memory>
#include <set>
#include <string>
#include <utility>
#include <vector>

namespace kvr::simulate {

/// Passes activities on to the simulated scheduler and tells the invariants of their runs; and somebody that
/// an activity has checked in.
class RecordingActivities : public ActivityScheduler {
 public:
  RecordingActivities(ActivityScheduler& scheduler, Log& log, Invariants& invariants,
                      std::function<void()> checkedIn)
      : scheduler_(scheduler), log_(log), invariants_(invariants), checkedIn_(std::move(checkedIn)) {}

  std::unique_ptr<Activity> newActivity(std::string identifier) override;
  void suspend() override { scheduler_.suspend(); }
  void resume() override { scheduler_.resume(); }

 private:
  ActivityScheduler& scheduler_;
  Log& log_;
  Invariants& invariants_;
  const std::function<void()> checkedIn_;
};

/// Passes listeners on, and tells somebody before each new one.
class RecordingListeners : public ServiceListeners {
 public:
  RecordingListeners(ServiceListeners& listeners, std::function<void()> beforeNew)
      : listeners_(listeners), beforeNew_(std::move(beforeNew)) {}

  std::unique_ptr<ServiceListener> newListener(std::string name) override {
    beforeNew_();
    return listeners_.newListener(std::move(name));
  }

 private:
  ServiceListeners& listeners_;
  const std::function<void()> beforeNew_;
};

/// Passes follow-ups on to the simulated centre and tells the invariants of them.
class RecordingCenter : public FollowUpCenter {
 public:
  RecordingCenter(FollowUpCenter& center, Invariants& invariants)
      : center_(center), invariants_(invariants) {}

  std::unique_ptr<FollowUpCenterClient> newClient(std::string clientIdentifier) override;

 private:
  FollowUpCenter& center_;
  Invariants& invariants_;
};

/// One life of the agent: a simulated platform that is watched, and the agent on it.
class Process {
 public:
  /// `files`: what the process before left behind, if there was one.
  Process(World& world, Invariants& invariants, std::uint64_t seed, LogLevel leastLogged,
          const SimulatedFiles* files);
  ~Process();
  Process(const Process&) = delete;
  Process& operator=(const Process&) = delete;

  void start();
  /// Ends as on a termination signal. What a client has asked to dismiss may go meanwhile.
  void stop(std::set<std::string> serialNumbersToDismiss);
  /// Nothing but what may wait for days is under way.
  bool isIdle() const { return openRequests_ == 0 && simulated.activities.runsUnderWay() == 0; }

  SimulatedPlatform simulated;

 private:
  /// Start-up takes its time, in which whatever else can run does.
  void letOthersRun();
  void answer(const HTTPRequest& request, const SimulatedHTTP::Answer& answer);

  World& world_;
  Invariants& invariants_;
  const double began_;
  const double pause_;  ///< seconds between two steps of start-up
  int openRequests_ = 0;
  /// Requests, with whether each has been answered.
  std::vector<std::pair<std::shared_ptr<bool>, SimulatedHTTP::Answer>> open_;
  RecordingActivities activities_;
  RecordingListeners services_;
  RecordingCenter followUps_;
  Platform platform_;
  std::unique_ptr<StartUp> startUp_;
};

}  // namespace kvr::simulate
