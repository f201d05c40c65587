#include "platform/stores/FileActivityScheduler.h"

#include "platform/names/Names.h"

#include <algorithm>
#include <cmath>
#include <exception>
#include <utility>

namespace kvr {
namespace {

constexpr auto kDictionary = PropertyListFiles::Expected::Dictionary;
constexpr auto kSetAside = PropertyListFiles::WhenDamaged::SetAside;

}  // namespace

class FileActivityScheduler::Handle : public Activity {
 public:
  Handle(FileActivityScheduler& scheduler, std::string identifier)
      : scheduler_(scheduler), identifier_(std::move(identifier)) {}

  const std::string& identifier() const override { return identifier_; }
  void checkIn(const ActivityCheckIn& known, ActivityBlock block) override {
    scheduler_.checkIn(identifier_, known, std::move(block));
  }
  void registerAnew(const ActivityRegistration& registration, ActivityBlock block) override {
    scheduler_.registerAnew(identifier_, registration, std::move(block));
  }
  void setEarliestDate(Date date) override { scheduler_.setEarliestDate(identifier_, date); }
  bool shouldDefer() const override { return scheduler_.shouldDefer(identifier_); }

 private:
  FileActivityScheduler& scheduler_;
  const std::string identifier_;
};

/// Receives the answer of one run. If it is destroyed without an answer, the run counts as deferred.
class FileActivityScheduler::RunEnd {
 public:
  RunEnd(FileActivityScheduler& scheduler, std::string identifier, std::uint64_t number)
      : scheduler_(scheduler), life_(scheduler.life_), identifier_(std::move(identifier)), number_(number) {}
  RunEnd(const RunEnd&) = delete;
  RunEnd& operator=(const RunEnd&) = delete;
  ~RunEnd() {
    try {
      tell(ActivityResult::Deferred);
    } catch (const std::exception&) {
      // Out of memory: the run counts as under way until the process ends.
      told_ = true;
    }
  }

  void tell(ActivityResult result) {
    if (std::exchange(told_, true)) return;
    if (const auto alive = life_.lock()) scheduler_.end(identifier_, number_, result);
  }

 private:
  FileActivityScheduler& scheduler_;
  const std::weak_ptr<const bool> life_;
  const std::string identifier_;
  const std::uint64_t number_;
  bool told_ = false;
};

/// Owns one `suspend` that was already called, and calls `resume` when it is destroyed.
class FileActivityScheduler::Suspension {
 public:
  explicit Suspension(FileActivityScheduler& scheduler) : scheduler_(scheduler), life_(scheduler.life_) {}
  Suspension(const Suspension&) = delete;
  Suspension& operator=(const Suspension&) = delete;
  ~Suspension() {
    const auto alive = life_.lock();
    if (!alive) return;
    try {
      scheduler_.resume();
    } catch (const std::exception& error) {
      scheduler_.log().error("activities are not started: %@", std::string(error.what()));
    }
  }

 private:
  FileActivityScheduler& scheduler_;
  const std::weak_ptr<const bool> life_;
};

FileActivityScheduler::FileActivityScheduler(PropertyListFiles& lists, const Clock& clock, WorkQueues& queues,
                                             Random& random, const DeviceProperties& device, Log& log,
                                             const std::string& mainBundleIdentifier,
                                             ActivityOccasions occasions)
    : lists_(lists),
      clock_(clock),
      queues_(queues),
      random_(random),
      device_(device),
      log_(log),
      directory_(lists.files().homeDirectory() + "/" + std::string(names::kActivitiesFolder)),
      path_(directory_ + "/" + mainBundleIdentifier + ".plist"),
      occasions_(std::move(occasions)),
      fileTurns_(queues.newTurns("the activities' file")) {}

std::unique_ptr<Activity> FileActivityScheduler::newActivity(std::string identifier) {
  return std::make_unique<Handle>(*this, std::move(identifier));
}

void FileActivityScheduler::suspend() {
  const std::lock_guard lock(mutex_);
  ++suspensions_;
}

void FileActivityScheduler::resume() {
  {
    const std::lock_guard lock(mutex_);
    --suspensions_;
  }
  startDue();
}

void FileActivityScheduler::checkIn(const std::string& identifier, const ActivityCheckIn& known,
                                    ActivityBlock block) {
  const auto& expected = known.expectation;
  const double fraction = draw();
  std::optional<std::string> version;
  if (identifier == occasions_.afterUpgrade) version = device_.answer(DeviceProperties::kProductVersion);
  bool changed = false;
  ActivityBlock replaced;
  load();
  {
    const std::lock_guard lock(mutex_);
    if (expected && !table_.isRegisteredFor(identifier, expected->date)) {
      replaced = table_
                     .add(identifier, expected->criteria, RegistrationCause::Demand, std::move(block), now(),
                          fraction)
                     .replaced;
      changed = true;
    } else {
      replaced = table_.checkIn(identifier, std::move(block));
    }
    if (identifier == occasions_.afterUpgrade) table_.noticeSystemVersion(identifier, version, known.isOwed);
    if (identifier == occasions_.afterBoot) {
      changed |= table_.noticeBoot(identifier, bootIdentifier());
    }
  }
  if (changed) save();
  startDue();
}

void FileActivityScheduler::registerAnew(const std::string& identifier,
                                         const ActivityRegistration& registration, ActivityBlock block) {
  const double fraction = draw();
  ActivityTable::Registered registered;
  load();
  {
    const std::lock_guard lock(mutex_);
    registered =
        table_.add(identifier, registration.criteria, registration.cause, std::move(block), now(), fraction);
  }
  if (registered.heldUntil) {
    log_.standard("'%@' was started %d times within %d seconds, and is held back until %@", identifier,
                  ActivityTable::kMostStarts, static_cast<int>(ActivityTable::kStartsPeriod),
                  *registered.heldUntil);
  }
  save();
  startDue();
}

void FileActivityScheduler::setEarliestDate(const std::string& identifier, Date date) {
  const std::lock_guard lock(mutex_);
  table_.setEarliestDate(identifier, date, now());
}

bool FileActivityScheduler::shouldDefer(const std::string& identifier) const {
  const std::lock_guard lock(mutex_);
  return ending_ || (!networkReachable_ && table_.isRunThatNeedsNetwork(identifier));
}

void FileActivityScheduler::setNetworkReachable(bool reachable) {
  {
    const std::lock_guard lock(mutex_);
    if (networkReachable_ == reachable) return;
    networkReachable_ = reachable;
    if (!reachable) table_.noticeNetworkLoss();
  }
  startDue();
}

void FileActivityScheduler::beginEnding() {
  const std::lock_guard lock(mutex_);
  ending_ = true;
  arm(std::nullopt);
}

std::size_t FileActivityScheduler::runsUnderWay() const {
  const std::lock_guard lock(mutex_);
  return table_.runsUnderWay();
}

ActivityTable::Now FileActivityScheduler::now() const { return {clock_.now(), uptime(), networkReachable_}; }

/// From 0 to below 1; the first digits of a random UUID are all random.
double FileActivityScheduler::draw() {
  constexpr int kDigits = 8;
  const std::string uuid = random_.uuid();
  return std::ldexp(static_cast<double>(std::stoul(uuid.substr(0, kDigits), nullptr, 16)), -4 * kDigits);
}

// Runs.

void FileActivityScheduler::startDue() {
  std::vector<ActivityTable::Run> runs;
  {
    const std::lock_guard lock(mutex_);
    if (ending_ || suspensions_ > 0) return;
    const auto moment = now();
    runs = table_.takeDue(moment);
    arm(table_.secondsToNext(moment));
  }
  // From here on an exception cannot lose a run: its `RunEnd` reports the end in any case.
  std::vector<std::shared_ptr<RunEnd>> ends;
  ends.reserve(runs.size());
  for (const auto& run : runs) ends.push_back(std::make_shared<RunEnd>(*this, run.identifier, run.number));
  for (std::size_t index = 0; index < runs.size(); ++index) start(std::move(runs[index].block), ends[index]);
}

void FileActivityScheduler::start(ActivityBlock block, const std::shared_ptr<RunEnd>& end) {
  queues_.concurrentQueue(Priority::Default)
      ->async([&log = log_, alive = life(), block = std::move(block), end] {
        if (alive.expired()) return;
        block(ActivityHandler(log, "activity run", [end](ActivityResult result) { end->tell(result); }));
      });
}

void FileActivityScheduler::end(const std::string& identifier, std::uint64_t number, ActivityResult result) {
  ActivityTable::Ending ending;
  {
    const std::lock_guard lock(mutex_);
    ending = table_.end(identifier, number, result, now());
    if (ending.servesOccasion) ++suspensions_;
  }
  const auto suspension = ending.servesOccasion ? std::make_shared<Suspension>(*this) : nullptr;
  if (ending.changesTree) {
    // Save on another queue: the caller may be the main queue, which must not wait for the disk.
    queues_.concurrentQueue(Priority::Default)->async([this, alive = life(), suspension] {
      if (!alive.expired()) save();
    });
  }
  startDue();
}

// The file.

void FileActivityScheduler::load() {
  if (loaded_) return;
  const Turn turn(*fileTurns_);
  if (loaded_) return;
  const auto tree = lists_.read(path_, kDictionary, kSetAside, ActivityTable::complaintAbout);
  const std::lock_guard lock(mutex_);
  unreadable_ = !tree;
  if (tree) table_.adopt(*tree);
  loaded_ = true;
}

void FileActivityScheduler::save() {
  bool adopted = false;
  {
    const Turn turn(*fileTurns_);
    adopted = write();
  }
  if (adopted) startDue();
}

/// Tries again to read a file that could not be read. Returns whether that succeeded.
bool FileActivityScheduler::adoptUnreadable() {
  {
    const std::lock_guard lock(mutex_);
    if (!unreadable_) return false;
  }
  const auto found = lists_.read(path_, kDictionary, kSetAside, ActivityTable::complaintAbout);
  if (!found) return false;  // `read` has logged it
  const std::lock_guard lock(mutex_);
  table_.adopt(*found);
  unreadable_ = false;
  return true;
}

/// Writes the file under its lock. Returns whether registrations were adopted that could not be read before.
bool FileActivityScheduler::write() {
  const auto fileLock = lists_.lock(directory_);
  const bool adopted = adoptUnreadable();
  Value tree;
  {
    const std::lock_guard lock(mutex_);
    if (unreadable_) return false;
    tree = table_.tree();
  }
  if (const auto error = lists_.write(path_, tree, PropertyListEncoding::Binary)) {
    log_.error("the activities cannot be stored: %@", *error);
  }
  return adopted;
}

}  // namespace kvr
