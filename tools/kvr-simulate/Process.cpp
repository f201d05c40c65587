#include "kvr-simulate/Process.h"

#include "platform/names/Names.h"

#include <algorithm>

namespace kvr::simulate {
namespace {

constexpr std::uint64_t kSlowStarts = 4;  ///< one start in so many is slow
constexpr double kLongestPause = 20;      ///< seconds between two steps of a slow start

HTTPResponse endingResponse() { return {0, std::nullopt, Error{"http", 42, "the process is ending"}}; }

class RecordingActivity : public Activity {
 public:
  RecordingActivity(std::unique_ptr<Activity> activity, Log& log, Invariants& invariants,
                    const std::function<void()>& checkedIn,
                    const std::function<void(const std::string&)>& registering)
      : activity_(std::move(activity)),
        log_(log),
        invariants_(invariants),
        checkedIn_(checkedIn),
        registering_(registering) {}

  const std::string& identifier() const override { return activity_->identifier(); }
  void setEarliestDate(Date date) override { activity_->setEarliestDate(date); }
  bool shouldDefer() const override { return activity_->shouldDefer(); }
  void checkIn(const ActivityCheckIn& known, ActivityBlock block) override {
    activity_->checkIn(known, recorded(std::move(block)));
    checkedIn_();
  }
  void registerAnew(const ActivityRegistration& registration, ActivityBlock block) override {
    registering_(identifier());
    activity_->registerAnew(registration, recorded(std::move(block)));
  }

 private:
  ActivityBlock recorded(ActivityBlock block) const {
    return [name = identifier(), block = std::move(block), &log = log_,
            &invariants = invariants_](const ActivityHandler& handler) {
      invariants.runBegins(name);
      block(ActivityHandler(log, "a run", [name, handler, &invariants](ActivityResult result) {
        invariants.runEnds(name, result);
        handler(result);
      }));
    };
  }

  const std::unique_ptr<Activity> activity_;
  Log& log_;
  Invariants& invariants_;
  const std::function<void()>& checkedIn_;
  const std::function<void(const std::string&)>& registering_;
};

class RecordingClient : public FollowUpCenterClient {
 public:
  RecordingClient(std::unique_ptr<FollowUpCenterClient> client, Invariants& invariants,
                  const RecordingCenter::Seen& seen)
      : client_(std::move(client)), invariants_(invariants), seen_(seen) {}

  std::optional<Error> postItem(const FollowUpItem& item) override {
    const auto pending = client_->pendingItems();
    const bool wasPending = invariants_.posting(item, pending ? *pending : std::vector<FollowUpItem>());
    auto error = client_->postItem(item);
    invariants_.posted(item, wasPending, !error);
    return error;
  }
  std::optional<Error> clearPendingItems(const std::vector<std::string>& uniqueIdentifiers) override {
    const auto pending = client_->pendingItems();
    if (pending) invariants_.clearing(uniqueIdentifiers, *pending);
    return client_->clearPendingItems(uniqueIdentifiers);
  }
  Result<std::vector<FollowUpItem>> pendingItems() override {
    auto pending = client_->pendingItems();
    if (pending) seen_(*pending);
    return pending;
  }

 private:
  const std::unique_ptr<FollowUpCenterClient> client_;
  Invariants& invariants_;
  const RecordingCenter::Seen& seen_;
};

}  // namespace

std::unique_ptr<Activity> RecordingActivities::newActivity(std::string identifier) {
  return std::make_unique<RecordingActivity>(scheduler_.newActivity(std::move(identifier)), log_, invariants_,
                                             checkedIn_, registering_);
}

std::unique_ptr<FollowUpCenterClient> RecordingCenter::newClient(std::string clientIdentifier) {
  return std::make_unique<RecordingClient>(center_.newClient(std::move(clientIdentifier)), invariants_,
                                           seen_);
}

Process::Process(World& world, Invariants& invariants, Clients& clients, std::uint64_t seed,
                 LogLevel leastLogged, const SimulatedFiles* files)
    : simulated(seed, leastLogged),
      world_(world),
      invariants_(invariants),
      began_(world.now),
      pause_(seed % kSlowStarts == 0 ? Dice(seed).between(0, kLongestPause) : 0),
      activities_(
          simulated.activities, simulated.log, invariants, [this] { letOthersRun(); },
          [this, &clients](const std::string& activity) {
            if (startUp_) clients.registering(simulated, activity);
          }),
      services_(simulated.services, [this] { letOthersRun(); }),
      followUps_(simulated.followUps, invariants,
                 [this, &clients](const std::vector<FollowUpItem>& pending) {
                   if (startUp_) clients.followUpsSeen(simulated, pending);
                 }),
      platform_{simulated.log,
                simulated.clock,
                simulated.queues,
                simulated.files,
                simulated.propertyLists,
                simulated.preferences,
                simulated.locale,
                simulated.random,
                simulated.http,
                simulated.deviceProperties,
                simulated.featureFlags,
                simulated.pairedDevices,
                simulated.accounts,
                simulated.accountSession,
                simulated.attestation,
                services_,
                simulated.processes,
                activities_,
                followUps_,
                simulated.carriers,
                simulated.notifications,
                simulated.observers,
                simulated.cleanExit,
                simulated.applications,
                simulated.store,
                simulated.stringTables,
                names::kAgent} {
  simulated.log.keepLast(60);
  if (files != nullptr) simulated.files.takeOver(*files);
  world.show(simulated);
  simulated.files.whenChanged(
      [&](const std::string& path, bool isDone) { invariants.fileChanged(path, isDone); });
  simulated.http.handler = [this](const HTTPRequest& request, bool, const SimulatedHTTP::Answer& answer) {
    this->answer(request, answer);
  };
}

Process::~Process() {
  simulated.files.whenChanged(nullptr);
  simulated.log.beginEnding();
  simulated.activities.beginEnding();
  simulated.queues.beginEnding();
  startUp_.reset();
  simulated.notifications.end();
  simulated.queues.end();
}

void Process::start() {
  StartUp::announce(simulated.log);
  startUp_ = std::make_unique<StartUp>(platform_);
}

void Process::letOthersRun() {
  if (startUp_) return;
  simulated.queues.advance(pause_);
  world_.now = began_ + simulated.clock.elapsed();
  invariants_.step();
}

void Process::stop(std::set<std::string> serialNumbersToDismiss) {
  invariants_.beginEnding(std::move(serialNumbersToDismiss));
  simulated.cleanExit.beginEnding();
  simulated.log.beginEnding();
  simulated.activities.beginEnding();
  for (auto& [done, answer] : std::exchange(open_, {})) {
    if (!std::exchange(*done, true)) answer(endingResponse());
  }
  simulated.queues.beginEnding();
  simulated.queues.run();
}

void Process::answer(const HTTPRequest& request, const SimulatedHTTP::Answer& answer) {
  const bool isCoverage = request.method == "POST";
  invariants_.requested(request, isCoverage);
  simulated.http.clearRequests();
  Service::Outcome outcome;
  if (world_.isNetworkReachable) {
    outcome = isCoverage ? world_.service.answerCoverage(request) : world_.service.answerVersions();
  } else {
    outcome.response = HTTPResponse{0, std::nullopt, Error{"http", 7, "There is no network."}};
  }
  if (simulated.cleanExit.isEnding()) return answer(endingResponse());
  ++openRequests_;
  const auto done = std::make_shared<bool>(false);
  std::erase_if(open_, [](const auto& open) { return *open.first; });
  open_.emplace_back(done, answer);
  const auto queue = simulated.queues.concurrentQueue(Priority::Default);
  // A request without an answer fails by its own timeout.
  simulated.queues.after(request.timeout, queue, [this, done] {
    if (!std::exchange(*done, true)) --openRequests_;
  });
  if (!outcome.response) return;
  simulated.queues.after(outcome.delay, queue, [this, outcome, answer, isCoverage, done] {
    if (!std::exchange(*done, true)) --openRequests_;
    if (isCoverage) invariants_.coverageAnswered(outcome.response->status);
    if (outcome.offer) {
      world_.service.at(*outcome.offer).lastServed = world_.now;
      invariants_.answered(world_.service.treeOf(*outcome.offer));
    }
    answer(*outcome.response);
  });
}

}  // namespace kvr::simulate
