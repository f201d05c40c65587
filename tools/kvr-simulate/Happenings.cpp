// The effect of each kind of event.

#include "core/devices/DeviceKeys.h"
#include "core/warranty/LookupPolicy.h"
#include "core/warranty/WarrantyKeys.h"
#include "kvr-simulate/Life.h"
#include "platform/codec/PropertyList.h"
#include "platform/names/Names.h"
#include "platform/services/PairedDeviceRegistry.h"
#include "platform/services/UserLocale.h"

#include <cerrno>

namespace kvr::simulate {
namespace {

constexpr double kMinute = 60;
constexpr double kHour = 3600;
constexpr double kDay = 24 * kHour;
constexpr double kYear = 365 * kDay;

}  // namespace

void Life::apply(const Event& event) {
  Dice dice(event.chance);
  say("#" + std::to_string(event.number) + " " + nameOf(event.kind));
  switch (event.kind) {
    case EventKind::Call:
      return call(dice);
    case EventKind::Offer:
      return offer(dice);
    case EventKind::Watch:
      return watch(dice);
    case EventKind::Account:
      return account(dice);
    case EventKind::Token:
      return token(dice);
    case EventKind::Locale:
      return language(dice);
    case EventKind::Clock:
      return clock(dice);
    case EventKind::Suspend:
      return suspend(dice);
    case EventKind::Network:
      return network(dice);
    case EventKind::Upgrade:
      ++world_.systemVersion;
      [[fallthrough]];
    case EventKind::Reboot:
      ++world_.boot;
      foretellDeath(dice);
      return end(false, dice.happens(0.7), dice.oneOf({20.0, kHour, kDay}));
    case EventKind::Stop:
      foretellDeath(dice);
      // Calls made just before, so that they are under way when the process ends.
      if (process_ && dice.happens(0.5)) {
        clients_.invoke(process_->simulated, "GetDefaultDeviceInfoUsingPolicy", {LookupPolicy::kRefresh});
        clients_.invoke(process_->simulated, "GetAllDeviceInfosUsingPolicy", {LookupPolicy::kRefresh, true});
      }
      return end(false, true, dice.oneOf({0.2, kMinute, kHour}));
    case EventKind::Crash:
      return crash(dice, false);
    case EventKind::PowerLoss:
      return crash(dice, true);
    case EventKind::ServiceFault:
      return serviceFault(dice);
    case EventKind::FileFault:
      return fileFault(dice);
    case EventKind::Attestation:
      return attestation(dice);
    case EventKind::Damage:
      return damage(dice);
    case EventKind::Setting:
      return setting(dice);
  }
}

/// Several programs may call at once, about the same device.
void Life::call(Dice& dice) {
  if (!process_) return;
  if (dice.happens(0.5)) clients_.lieInWait(dice);
  const auto serialNumber = dice.oneOf(world_.serialNumbers());
  for (auto calls = dice.oneOf({1, 1, 2, 6}); calls > 0; --calls) {
    say("  " + clients_.ask(dice, process_->simulated, serialNumber));
  }
}

void Life::offer(Dice& dice) {
  const Date now = SimulatedClock::kDefaultStart + world_.now + clockOffset_;
  const auto serialNumber = dice.oneOf(world_.serialNumbers());
  const auto number = world_.service.publish(world_.drawOffer(dice, serialNumber, now));
  say("  " + serialNumber + ": " + describe(world_.service.treeOf(number)));
}

void Life::watch(Dice& dice) {
  if (world_.watches.empty()) return;
  auto& watch = world_.watches[dice.below(world_.watches.size())];
  const char* notification = names::kDeviceDidUnpair;
  if (!watch.isPaired) {
    watch.isPaired = true;
    watch.isArchived = false;
    const Date now = SimulatedClock::kDefaultStart + world_.now + clockOffset_;
    watch.pairedBefore = std::exchange(watch.paired, now);
    watch.pairedBefore = std::min(watch.pairedBefore, watch.paired);
    notification = names::kDeviceDidPair;
  } else if (dice.happens(0.3)) {
    watch.isArchived = !watch.isArchived;
    if (!watch.isArchived) notification = names::kDeviceDidPair;
  } else {
    watch.isPaired = false;
  }
  say(std::string("  ") + notification + " " + watch.serialNumber);
  invariants_.excuseRuns();
  disturb();
  if (!process_) return;
  world_.show(process_->simulated);
  process_->simulated.notifications.post(notification);
}

void Life::account(Dice& dice) {
  world_.hasAccount = !world_.hasAccount;
  world_.accountChanged = world_.now;
  disturb();
  if (!world_.hasAccount)
    later(dice.between(0, 3 * kDay), [this] {
      world_.hasAccount = true;
      world_.accountChanged = world_.now;
      if (process_) world_.show(process_->simulated);
    });
  if (process_) world_.show(process_->simulated);
}

void Life::token(Dice& dice) {
  world_.service.validToken = "token " + std::to_string(dice.number());
  world_.renewal = {};
  world_.renewal.resultCode = dice.happens(0.7) ? 0 : 1;
  world_.renewal.delay = dice.oneOf({0.5, 20.0, 100.0});
  world_.renewal.never = dice.happens(0.1);
  invariants_.trouble();
  if (process_) world_.show(process_->simulated);
  later(dice.between(0, kDay), [this] {
    world_.renewal = {};
    invariants_.trouble();
    if (process_) world_.show(process_->simulated);
  });
}

void Life::language(Dice& dice) {
  world_.locale = dice.oneOf({"en_US", "fr_FR", "de_DE"});
  disturb();
  if (!process_) return;
  world_.show(process_->simulated);
  process_->simulated.notifications.post(names::kLanguageChanged);
}

void Life::setClock(double offset) {
  ++invariants_.figures.clockJumps;
  clockOffset_ = offset;
  invariants_.clockMoved();
  disturb();
  if (process_) process_->simulated.clock.set(SimulatedClock::kDefaultStart + world_.now + offset);
}

void Life::clock(Dice& dice) {
  const double offset = dice.oneOf({0.0, kDay, -kDay, 10 * kYear, -10 * kYear, dice.between(-kDay, kDay)});
  say("  to " + std::to_string(offset));
  setClock(offset);
  if (dice.happens(0.7)) later(dice.between(0, 2 * kDay), [this] { setClock(0); });
}

void Life::suspend(Dice& dice) {
  if (!process_) return;
  const double seconds = dice.oneOf({kMinute, kHour, 3 * kDay});
  process_->simulated.queues.suspend(seconds);
  world_.now += seconds;
  clients_.excuse(seconds);
  invariants_.suspended(seconds);
  disturb();
}

void Life::network(Dice& dice) {
  const auto setReachable = [this](bool isReachable) {
    world_.isNetworkReachable = isReachable;
    invariants_.excuseRuns();
    disturb();
    if (process_) process_->simulated.activities.setNetworkReachable(isReachable);
  };
  setReachable(false);
  later(dice.oneOf({5.0, kHour, dice.between(0, 3 * kDay)}), [setReachable] { setReachable(true); });
}

void Life::crash(Dice& dice, bool losesPower) {
  if (!process_) return;
  losesPower_ = losesPower;
  if (dice.happens(0.2)) {
    ++(losesPower ? invariants_.figures.powerLosses : invariants_.figures.crashes);
    return end(losesPower, false, dice.oneOf({0.2, 5.0, kHour}));
  }
  process_->simulated.files.killAfterSteps(1 + dice.below(40));
}

void Life::serviceFault(Dice& dice) {
  invariants_.trouble();
  using Fault = Service::Fault;
  const auto draw = [&dice] {
    return dice.oneOf({Fault::Refuses, Fault::Refuses, Fault::Breaks, Fault::Late, Fault::Never,
                       Fault::Garbage, Fault::Null, Fault::Giant, Fault::Deep, Fault::Other,
                       Fault::Unreachable});
  };
  auto& service = world_.service;
  if (dice.happens(0.8)) service.coverageFault = draw();
  if (dice.happens(0.3)) service.versionFault = draw();
  service.faultShare = dice.oneOf({1.0, 1.0, 0.5});
  say("  " + std::to_string(static_cast<int>(service.coverageFault)) + " " +
      std::to_string(static_cast<int>(service.versionFault)));
  later(dice.oneOf({kMinute, kHour, dice.between(0, 3 * kDay)}), [this] {
    world_.service.coverageFault = world_.service.versionFault = Fault::None;
    disturb();
  });
  if (dice.happens(0.5)) call(dice);
}

void Life::fileFault(Dice& dice) {
  ++invariants_.figures.fileFaults;
  using Step = SimulatedFiles::Step;
  const int code = dice.oneOf({EIO, ENOSPC, EROFS});
  const auto step =
      code == EROFS
          ? std::nullopt
          : dice.oneOf<std::optional<Step>>({std::nullopt, Step::CreateTemporary, Step::Write, Step::Sync,
                                             Step::Rename, Step::SyncDirectory, Step::Remove});
  const auto part = dice.oneOf<std::string>({"/", "/", "Preferences", "FollowUps", "Activities", "Kavrel"});
  stepFault_ = [=](Step asked, const std::string& path) -> std::optional<Error> {
    if ((step && *step != asked) || path.find(part) == std::string::npos) return std::nullopt;
    return Error{"files", code, "planted"};
  };
  say("  error " + std::to_string(code) + " in " + part);
  invariants_.excuseFiles();
  disturb();
  if (process_) process_->simulated.files.setStepFault(stepFault_);
  later(dice.oneOf({5.0, kHour, dice.between(0, 2 * kDay)}), [this] {
    stepFault_ = nullptr;
    disturb();
    invariants_.endFileFaults();
    if (process_) process_->simulated.files.setStepFault(nullptr);
  });
}

void Life::attestation(Dice& dice) {
  world_.hasAttestation = false;
  world_.attestation = SimulatedDeviceAttestation::failed(dice.oneOf({-11, -4, -1}), 0.5);
  world_.attestation.never = dice.happens(0.3);
  later(dice.between(0, 3 * kDay), [this] {
    world_.hasAttestation = true;
    if (process_) world_.show(process_->simulated);
  });
  if (process_) world_.show(process_->simulated);
}

void Life::damage(Dice& dice) {
  // The agent's preferences are damaged more often than other files, and while no process runs, so that the
  // next one finds them damaged.
  const bool isOfPreferences = dice.happens(0.5);
  if (isOfPreferences) {
    foretellDeath(dice);
    end(false, dice.happens(0.5), dice.oneOf({0.2, kHour}));
  }
  auto& files = process_ ? process_->simulated.files : *files_;
  const auto paths = files.list(files.homeDirectory() + (isOfPreferences ? "/Library/Preferences" : ""));
  if (paths.empty()) return;
  const auto& path = dice.oneOf(paths);
  const auto bytes = *files.get(path);
  invariants_.allowDamage();
  say("  " + path);
  if (dice.happens(0.2)) {
    files.erase(path);
  } else {
    files.put(path, dice.happens(0.5) ? bytes.substr(0, dice.below(bytes.size() + 1)) : "garbage {");
  }
  invariants_.readFilesAgain();
}

void Life::setting(Dice& dice) {
  if (!process_) return;
  auto& preferences = process_->simulated.preferences;
  const auto host = "other" + std::to_string(dice.below(3)) + ".example";
  switch (dice.below(3)) {
    case 0:
      invariants_.shortestDay = 1800;
      preferences.setObject(dice.oneOf({kDayLengths[1], kDayLengths[2]}), preference::kOneDayInterval);
      // Long enough for some hundred runs of activities.
      later(3 * kDay, [this] {
        if (process_) process_->simulated.preferences.setObject(kDayLengths[0], preference::kOneDayInterval);
      });
      break;
    case 1:
      preferences.setObject(dice.oneOf({0, 60, 1'000'000}), preference::kCachedWarrantyValidityDuration);
      break;
    default:
      world_.hosts.push_back(host);
      preferences.setObject("https://" + host + "/summary", preference::kWearablesWarrantyURL);
      break;
  }
  invariants_.readFilesAgain();
}

void Life::endFaults() {
  world_.service.coverageFault = world_.service.versionFault = Service::Fault::None;
  world_.renewal = {};
  world_.hasAttestation = world_.hasAccount = world_.isNetworkReachable = true;
  stepFault_ = nullptr;
  stepsToLive_.reset();
  invariants_.endFileFaults();
  if (clockOffset_ != 0) setClock(0);
  disturb();
  if (process_) {
    // Cancel a crash that has not happened yet.
    process_->simulated.files.killAfterSteps(static_cast<std::size_t>(-1) / 2);
    process_->simulated.files.setStepFault(nullptr);
    world_.show(process_->simulated);
  }
}

}  // namespace kvr::simulate
