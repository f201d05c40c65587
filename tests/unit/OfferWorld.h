#pragma once

#include "core/devices/KVRDeviceInfo.h"
#include "core/followup/FollowUpKeys.h"
#include "core/scheduling/KVRScheduler.h"
#include "core/scheduling/SchedulingKeys.h"
#include "platform/names/Names.h"
#include "platform/services/FollowUpCenter.h"
#include "unit/CoverageWorld.h"

namespace kvr {

/// A test with offers; dates are given in days from now.
struct AnOfferTest : CoverageTest {
  Date inDays(double days) const { return world.clock.now() + days * kDay; }

  /// The dictionary of an offer with all its texts; `more` takes precedence.
  Dictionary offer(double endsInDays, const Dictionary& more = {}) const {
    Dictionary dictionary = more;
    dictionary.merge(Dictionary{
        {"zubOfferEligibleUntil", inDays(endsInDays).secondsSince1970},
        {"zubLocalizedOfferLabel", "Zub"},
        {"zubLocalizedOfferSingularDesc", "One day left"},
        {"zubLocalizedOfferPluralDescFormat", "%@ days left"},
        {"zubLocalizedOfferCTA", "Add"},
        {"featureToggleParameters", Dictionary{{"zubOfferDisplay", true}}},
    });
    return dictionary;
  }
  /// The offer with further parameters in addition to the one that displays it.
  static Dictionary with(Dictionary parameters, Dictionary offer) {
    parameters["zubOfferDisplay"] = true;
    offer["featureToggleParameters"] = std::move(parameters);
    return offer;
  }
  Dictionary shownInDays(double displayInDays, double endsInDays) const {
    return offer(endsInDays, {{"zubOfferFollowupDisplayDate", inDays(displayInDays).secondsSince1970}});
  }
  /// An offer whose follow-up is due.
  Dictionary due(double endsInDays) const { return shownInDays(-1, endsInDays); }
  KVRDeviceInfoRef info(const std::optional<std::string>& serialNumber, const Value& warranty,
                        std::optional<Date> activation = {}, std::uint64_t type = KVRDevice::kLocal) {
    return KVRDeviceInfo::deviceInfoWithDevice(KVRDevice::deviceWithName("D", serialNumber, activation, type),
                                               KVRWarranty::initWithDictionary(world.platform, warranty));
  }
  std::vector<FollowUpItem> pending() {
    auto items = world.followUps.newClient(names::kFollowUpClient)->pendingItems();
    return items ? *std::move(items) : std::vector<FollowUpItem>{};
  }
  std::vector<std::string> pendingSerials() {
    std::vector<std::string> serials;
    for (const auto& item : pending())
      serials.push_back(item.userInfo.at(names::kFollowUpSerialNumber).string());
    return serials;
  }
  /// The log lines since the last call, without those about building an item and without the name of the
  /// operation.
  std::vector<std::string> newLines() {
    std::vector<std::string> lines;
    for (auto line : world.log.texts()) {
      if (line.find("_setupFollowUpItem") != std::string::npos) continue;
      const auto end = line.starts_with("-[") ? line.find("]: ") : std::string::npos;
      lines.push_back(end == std::string::npos ? line : line.substr(end + 3));
    }
    world.log.clear();
    return lines;
  }
  std::optional<Date> target(const std::string& identifier) {
    return world.preferences.dateForKey(identifier + names::kTargetDateSuffix);
  }
  /// Runs an activity directly; returns its result if there is one at once.
  template <class Activity, class... Means>
  std::optional<ActivityResult> start(Means... means) {
    result.reset();
    const auto activity = std::make_shared<Activity>(world.platform, means...);
    activity->performActivityForScheduler(
        KVRScheduler::newSchedulerWithActivityDelegate(world.platform, activity),
        ActivityHandler(world.log, "test", [this](ActivityResult it) { result = it; }));
    return result;
  }
  std::optional<ActivityResult> result;  ///< of the last activity
  Array hashes(const char* key) {
    const auto list = world.preferences.objectForKey(key);
    return list.isArray() ? list.array() : Array{};
  }
  static FollowUpItem item(const std::string& uniqueIdentifier, std::uint64_t displayStyle,
                           const Dictionary& userInfo = {}) {
    FollowUpItem item;
    item.uniqueIdentifier = uniqueIdentifier;
    item.displayStyle = displayStyle;
    item.userInfo = userInfo;
    return item;
  }
  /// Posts an item that the agent has not posted.
  void pend(const std::string& uniqueIdentifier, const Dictionary& userInfo = {}) {
    const auto client = world.followUps.newClient(names::kFollowUpClient);
    EXPECT_FALSE(client->postItem(item(uniqueIdentifier, 2, userInfo)));
  }
};

}  // namespace kvr
