#include "core/followup/RefreshPlan.h"

#include "core/followup/DeviceFacts.h"

namespace kvr {
namespace {

bool removes(RefreshOutcome outcome) {
  return outcome == RefreshOutcome::NoWarranty || outcome == RefreshOutcome::NotOffered ||
         outcome == RefreshOutcome::Ended;
}

}  // namespace

KVRDeviceInfoList RefreshPlan::infosWith(RefreshOutcome outcome) const {
  KVRDeviceInfoList infos;
  for (const auto& step : steps) {
    if (step.outcome == outcome) infos.push_back(step.info);
  }
  return infos;
}

std::vector<KVRDeviceRef> RefreshPlan::devicesToRemove() const {
  std::vector<KVRDeviceRef> devices;
  for (const auto& step : steps) {
    if (removes(step.outcome)) devices.push_back(step.info->device());
  }
  for (const auto& serialNumber : untracked) devices.push_back(untrackedDevice(serialNumber));
  return devices;
}

KVRDeviceRef untrackedDevice(const std::string& serialNumber) {
  return KVRDevice::deviceWithName(serialNumber, serialNumber, std::nullopt, KVRDevice::kLocal);
}

RefreshPlan planRefresh(const KVRDeviceInfoList& deviceInfos, const std::set<std::string>& pendingSerials,
                        Date now, bool clearUntracked, bool allowForcePost) {
  RefreshPlan plan;
  if (clearUntracked) plan.untracked = pendingSerials;
  for (const auto& info : deviceInfos) {
    const auto serialNumber = serialNumberOf(*info);
    if (serialNumber) plan.untracked.erase(*serialNumber);
    const bool isPending = serialNumber && pendingSerials.contains(*serialNumber);
    plan.steps.push_back({info, refreshOutcome(offerFactsOf(*info), now, isPending, allowForcePost)});
  }
  return plan;
}

}  // namespace kvr
