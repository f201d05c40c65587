#include "followup/DeviceInfosQuery.h"

#include "agent/AgentKeys.h"
#include "agent/KVRAgent.h"

namespace kvr {

DeviceInfosQuery newAgentQuery(Platform& platform) {
  return [&platform](std::uint64_t policy, DeviceInfosAnswer answer) {
    KVRAgent::initWithCallingProcessBundleID(platform, kPreferencesBundleID)
        ->getAllDeviceInfosUsingPolicy(
            policy, false,
            DeviceInfosReply(platform.log, "newAgentQuery",
                             [answer = std::move(answer)](const KVRDeviceInfoList& list) { answer(list); }));
  };
}

}  // namespace kvr
