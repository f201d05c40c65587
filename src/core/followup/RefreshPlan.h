#pragma once

#include "core/devices/KVRDeviceInfo.h"
#include "core/followup/FollowUpRules.h"

#include <set>
#include <string>
#include <vector>

namespace kvr {

/// What a refresh does with each device's follow-up, decided before anything is done.
struct RefreshPlan {
  struct Step {
    KVRDeviceInfoRef info;
    RefreshOutcome outcome;
  };

  std::vector<Step> steps;          ///< one a device, in the order of the list
  std::set<std::string> untracked;  ///< serial numbers of pending items whose devices are not in the list

  /// The infos that come to this outcome, in order.
  KVRDeviceInfoList infosWith(RefreshOutcome outcome) const;
  /// The devices whose follow-ups go, in order, those without a step last.
  std::vector<KVRDeviceRef> devicesToRemove() const;
};

/// The device of an item whose owner is not known any more.
KVRDeviceRef untrackedDevice(const std::string& serialNumber);

/// `pendingSerials` are those of the pending items. `allowForcePost` has what is not pending posted again,
/// `clearUntracked` has the items removed whose devices are not in the list.
RefreshPlan planRefresh(const KVRDeviceInfoList& deviceInfos, const std::set<std::string>& pendingSerials,
                        Date now, bool clearUntracked, bool allowForcePost);

}  // namespace kvr
