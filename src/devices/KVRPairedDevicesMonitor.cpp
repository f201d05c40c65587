#include "devices/KVRPairedDevicesMonitor.h"

#include "agent/LookupPolicy.h"
#include "followup/KVRFollowUpPost.h"
#include "scheduling/KVRScheduler.h"

namespace kvr {

std::shared_ptr<KVRPairedDevicesMonitor> KVRPairedDevicesMonitor::initWithAgent(
    Platform& platform, std::shared_ptr<KVRAgentProtocol> agent) {
  return std::make_shared<KVRPairedDevicesMonitor>(platform, std::move(agent));
}

KVRPairedDevicesMonitor::KVRPairedDevicesMonitor(Platform& platform,
                                                 std::shared_ptr<KVRAgentProtocol> theAgent)
    : agent(std::move(theAgent)),
      platform_(platform),
      refreshes_(platform.log, platform.queues.mainQueue()) {}

KVRPairedDevicesMonitor::~KVRPairedDevicesMonitor() {
  for (const auto token : {pairNotifyToken.load(), unpairNotifyToken.load()}) {
    if (token != 0) platform_.notifications.cancel(token);
  }
}

void KVRPairedDevicesMonitor::start() {
  const auto handler = [self = shared_from_this()] { self->_pairedOrActiveDevicesDidChange(); };
  pairNotifyToken = platform_.notifications.registerFor(PairedDeviceRegistry::kDeviceDidPair, handler);
  unpairNotifyToken = platform_.notifications.registerFor(PairedDeviceRegistry::kDeviceDidUnpair, handler);
}

void KVRPairedDevicesMonitor::_pairedOrActiveDevicesDidChange() {
  platform_.log.standard("%s", "-[KVRPairedDevicesMonitor _pairedOrActiveDevicesDidChange:]");
  _updatePariedDevicesFollowUp();
}

void KVRPairedDevicesMonitor::_updatePariedDevicesFollowUp() {
  const auto turn = refreshes_.begin([self = shared_from_this()] { self->_updatePariedDevicesFollowUp(); });
  if (!turn) return;
  agent()->getAllDeviceInfosUsingPolicy(
      LookupPolicy::kDefault, true,
      DeviceInfosReply(platform_.log, "_updatePariedDevicesFollowUp",
                       [self = shared_from_this(), turn](const KVRDeviceInfoList& deviceInfos) {
                         self->platform_.log.standard(
                             "Devices followups to be posted, if required, after paired device change");
                         self->schedulePost(deviceInfos);
                       }));
}

void KVRPairedDevicesMonitor::schedulePost(const KVRDeviceInfoList& deviceInfos) {
  const auto date = KVRFollowUpPost::nextFollowUpPostDateWithDevicesInfo(platform_, deviceInfos);
  if (!date) return;
  platform_.log.standard(
      "Watch paired after phone's refreshActivity has already finished. Schedule followUp post for: %@",
      date);
  KVRScheduler::newSchedulerWithActivityDelegate(platform_, std::make_shared<KVRFollowUpPost>(platform_))
      ->scheduleActivityForDate(date);
}

}  // namespace kvr
