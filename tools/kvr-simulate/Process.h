#pragma once

#include "core/agent/StartUp.h"
#include "kvr-simulate/Clients.h"
#include "kvr-simulate/Invariants.h"

#include <functional>
#include <memory>
#include <set>
#include <string>
#include <utility>
#include <vector>

namespace kvr::simulate {

/// Forwards to the simulated scheduler and reports runs to the invariants; calls `checkedIn` after each
/// check-in of an activity, and `registering` before each registration.
class RecordingActivities : public ActivityScheduler {
 public:
  RecordingActivities(ActivityScheduler& scheduler, Log& log, Invariants& invariants,
                      std::function<void()> checkedIn,
                      std::function<void(const std::string& activity)> registering)
      : scheduler_(scheduler),
        log_(log),
        invariants_(invariants),
        checkedIn_(std::move(checkedIn)),
        registering_(std::move(registering)) {}

  std::unique_ptr<Activity> newActivity(std::string identifier) override;
  void suspend() override { scheduler_.suspend(); }
  void resume() override { scheduler_.resume(); }

 private:
  ActivityScheduler& scheduler_;
  Log& log_;
  Invariants& invariants_;
  const std::function<void()> checkedIn_;
  const std::function<void(const std::string& activity)> registering_;
};

/// Forwards to the simulated listeners and calls `beforeNew` before each new listener.
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

/// Forwards to the simulated follow-up centre and reports posting and clearing to the invariants; calls
/// `seen` after each look at the pending items.
class RecordingCenter : public FollowUpCenter {
 public:
  using Seen = std::function<void(const std::vector<FollowUpItem>& pending)>;

  RecordingCenter(FollowUpCenter& center, Invariants& invariants, Seen seen)
      : center_(center), invariants_(invariants), seen_(std::move(seen)) {}

  std::unique_ptr<FollowUpCenterClient> newClient(std::string clientIdentifier) override;

 private:
  FollowUpCenter& center_;
  Invariants& invariants_;
  const Seen seen_;
};

/// One process of the agent: a simulated platform that is observed, and the agent on it.
class Process {
 public:
  /// `files`: the files that the previous process left, or null.
  Process(World& world, Invariants& invariants, Clients& clients, std::uint64_t seed, LogLevel leastLogged,
          const SimulatedFiles* files);
  ~Process();
  Process(const Process&) = delete;
  Process& operator=(const Process&) = delete;

  void start();
  /// Ends as on a termination signal. Follow-ups that clients have asked to dismiss may go meanwhile.
  void stop(std::set<std::string> serialNumbersToDismiss);
  /// Whether nothing is under way except what may wait for days.
  bool isIdle() const { return openRequests_ == 0 && simulated.activities.runsUnderWay() == 0; }

  SimulatedPlatform simulated;

 private:
  /// Lets other work run in the middle of start-up.
  void letOthersRun();
  void answer(const HTTPRequest& request, const SimulatedHTTP::Answer& answer);

  World& world_;
  Invariants& invariants_;
  const double began_;
  const double pause_;  ///< seconds between two steps of start-up
  int openRequests_ = 0;
  /// Requests without an answer yet, each with a flag that is set once it is done.
  std::vector<std::pair<std::shared_ptr<bool>, SimulatedHTTP::Answer>> open_;
  RecordingActivities activities_;
  RecordingListeners services_;
  RecordingCenter followUps_;
  Platform platform_;
  std::unique_ptr<StartUp> startUp_;
};

}  // namespace kvr::simulate
