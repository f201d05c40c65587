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

  std::vector<Step> steps;          ///< one per device, in the order of the list
  std::set<std::string> untracked;  ///< serial numbers of pending items whose devices are not in the list

  /// The infos with this outcome, in order.
  KVRDeviceInfoList infosWith(RefreshOutcome outcome) const;
  /// The devices whose follow-ups are to be removed, in order, the untracked ones last.
  std::vector<KVRDeviceRef> devicesToRemove() const;
};

/// A device record for an item whose device is no longer known.
KVRDeviceRef untrackedDevice(const std::string& serialNumber);

/// `pendingSerials` are those of the pending items. `allowForcePost` posts again what is not pending;
/// `clearUntracked` removes the items whose devices are not in the list.
RefreshPlan planRefresh(const KVRDeviceInfoList& deviceInfos, const std::set<std::string>& pendingSerials,
                        Date now, bool clearUntracked, bool allowForcePost);

}  // namespace kvr
