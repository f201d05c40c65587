#include "agent/StartUp.h"

#include "agent/AgentKeys.h"
#include "agent/Configuration.h"

namespace kvr {

StartUp::StartUp(Platform& platform) : delegate_(platform) {
  platform.log.standard("launched");
  kvr_registerDefaults(platform.preferences);
  // The five long-lived activities are armed here, in this order: post-upgrade, post-boot, outreach,
  // conversion outreach, follow-up refresh.
  agent_ = KVRAgent::initWithCallingProcessBundleID(platform, kPreferencesBundleID);
  // Migration runs here, synchronously; then the locale monitor and the paired-devices monitor start with
  // this agent.
  listener_ = platform.services.newListener(kServiceName);
  listener_->setDelegate(delegate_);
  listener_->resume(agentServiceInterface());
}

}  // namespace kvr
