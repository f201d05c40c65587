#include "core/agent/Activities.h"

#include "core/agent/KVRAgent.h"
#include "core/followup/KVRFollowUpPost.h"
#include "core/followup/KVRFollowUpRefresh.h"
#include "core/outreach/KVRConversionOutreachActivity.h"
#include "core/outreach/KVROutreachActivity.h"
#include "core/outreach/KVRPostBootActivity.h"
#include "core/outreach/KVRPostUpgradeActivity.h"
#include "core/scheduling/ActivityRegistry.h"
#include "core/warranty/WarrantyKeys.h"
#include "platform/names/Names.h"

namespace kvr {

DeviceInfosQuery deviceInfosQueryOf(std::shared_ptr<KVRAgentProtocol> agent, Log& log) {
  return
      [agent = std::move(agent), &log](std::uint64_t policy, bool updateFollowUps, DeviceInfosAnswer answer) {
        agent->getAllDeviceInfosUsingPolicy(
            policy, updateFollowUps,
            DeviceInfosReply(log, "getAllDeviceInfosUsingPolicy",
                             [answer = std::move(answer)](const KVRDeviceInfoList& list) { answer(list); }));
      };
}

DeviceInfosQuery newAgentQuery(Platform& platform) {
  return [&platform](std::uint64_t policy, bool updateFollowUps, DeviceInfosAnswer answer) {
    deviceInfosQueryOf(KVRAgent::initWithCallingProcessBundleID(platform, kPreferencesBundleID),
                       platform.log)(policy, updateFollowUps, std::move(answer));
  };
}

void registerActivities(Platform& platform) {
  auto& registry = ActivityRegistry::of(platform);
  registry.add(names::kPostUpgrade,
               [&platform] { return std::make_shared<KVRPostUpgradeActivity>(platform); });
  registry.add(names::kPostBoot, [&platform] { return std::make_shared<KVRPostBootActivity>(platform); });
  registry.add(names::kOutreach, [&platform] { return std::make_shared<KVROutreachActivity>(platform); });
  registry.add(names::kConversionOutreach,
               [&platform] { return std::make_shared<KVRConversionOutreachActivity>(platform); });
  registry.add(names::kFollowUpPost,
               [&platform] { return std::make_shared<KVRFollowUpPost>(platform, newAgentQuery(platform)); });
  registry.add(names::kFollowUpRefresh, [&platform] {
    return std::make_shared<KVRFollowUpRefresh>(platform, newAgentQuery(platform));
  });
}

}  // namespace kvr
