// Bringing pending follow-ups up to date.

#include "core/followup/DeviceFacts.h"
#include "core/followup/FollowUpKeys.h"
#include "core/followup/KVRFollowUp.h"
#include "core/followup/OutcomeText.h"
#include "core/followup/RefreshPlan.h"
#include "platform/names/Names.h"

#include <algorithm>
#include <set>

namespace kvr {
namespace {

constexpr const char* kRefresh =
    "-[KVRFollowUp refreshFollowupWithDeviceInfos:clearUntrackedDeviceFollowups:allowForcePost:]";

/// The serial number of the device that an item is for; nothing if the item names none.
std::optional<std::string> serialNumberIn(const FollowUpItem& item) {
  const auto found = item.userInfo.find(names::kFollowUpSerialNumber);
  return found == item.userInfo.end() ? std::nullopt : found->second.stringIfAny();
}

void logOutcome(Log& log, RefreshOutcome outcome, const KVRDeviceRef& device) {
  switch (outcome) {
    case RefreshOutcome::NoWarranty:
      log.standard("%s: No warranty downloaded for device. Remove the followup for %{private}@", kRefresh,
                   device);
      break;
    case RefreshOutcome::NotOffered:
      log.standard("%s: Device NOT eligible. Remove the followup for %{private}@", kRefresh, device);
      break;
    case RefreshOutcome::Ended:
      log.standard("%s: Device no longer eligible. Remove the followup for %{private}@", kRefresh, device);
      break;
    case RefreshOutcome::Update:
      log.standard("%s: Device eligible. Update the followup for %{private}@", kRefresh, device);
      break;
    case RefreshOutcome::Repost:
      log.standard("%s: Device eligible for re-post. Re-post the followup for %{private}@", kRefresh, device);
      break;
    case RefreshOutcome::LeaveAlone:
      log.standard("%s: Followup already dismissed/not present for %{private}@, leaving unposted", kRefresh,
                   device);
      break;
  }
}

}  // namespace

KVRDeviceInfoList KVRFollowUp::refreshFollowupWithDeviceInfos(const KVRDeviceInfoList& deviceInfos) {
  return refreshFollowupWithDeviceInfos(deviceInfos, true, false);
}

KVRDeviceInfoList KVRFollowUp::refreshFollowupWithDeviceInfo(const KVRDeviceInfoRef& deviceInfo,
                                                             bool allowForcePost) {
  return refreshFollowupWithDeviceInfos({deviceInfo}, false, allowForcePost);
}

KVRDeviceInfoList KVRFollowUp::refreshFollowupWithDeviceInfos(const KVRDeviceInfoList& deviceInfos,
                                                              bool clearUntrackedDeviceFollowups,
                                                              bool allowForcePost) {
  const auto turn = takeTurn();
  auto& log = platform_.log;
  auto pending = pendingItems();
  std::set<std::string> pendingSerials;
  for (const auto& item : pending) {
    if (auto serialNumber = serialNumberIn(item)) pendingSerials.insert(*std::move(serialNumber));
  }
  const auto plan = planRefresh(deviceInfos, pendingSerials, platform_.clock.now(),
                                clearUntrackedDeviceFollowups, allowForcePost);
  for (const auto& step : plan.steps) logOutcome(log, step.outcome, step.info->device());
  for (const auto& serialNumber : plan.untracked) {
    log.standard("No longer tracking device %{private}@, clearing", untrackedDevice(serialNumber));
  }

  if (const auto toRemove = plan.devicesToRemove(); !toRemove.empty()) _clearFollowUpWithDevices(toRemove);
  auto shown = updateItems(pending, plan.infosWith(RefreshOutcome::Update));
  if (const auto toRepost = plan.infosWith(RefreshOutcome::Repost); !toRepost.empty()) {
    const bool isPosted = _postFollowUpWithDevicesInfo(toRepost, true);
    log.standard("Reposted follow-up: %@", isPosted ? "success" : "NO");
    if (isPosted) shown.insert(shown.end(), toRepost.begin(), toRepost.end());
  }
  return shown;
}

KVRDeviceInfoList KVRFollowUp::updateItems(std::vector<FollowUpItem>& pending,
                                           const KVRDeviceInfoList& deviceInfos) {
  KVRDeviceInfoList updated;
  for (const auto& info : deviceInfos) {
    const auto serialNumber = serialNumberOf(*info);
    const auto item = std::find_if(pending.begin(), pending.end(), [&](const FollowUpItem& candidate) {
      return serialNumberIn(candidate) == serialNumber;
    });
    if (item == pending.end()) continue;
    _setupFollowUpItem(*item, *info);
    const auto error = followUpProvider()->postFollowUpItem(*item);
    platform_.log.standard("Updated follow-up: %@", outcomeText(error));
    updated.push_back(info);
  }
  return updated;
}

}  // namespace kvr
