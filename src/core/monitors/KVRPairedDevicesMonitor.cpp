#include "core/monitors/KVRPairedDevicesMonitor.h"

#include "core/followup/KVRFollowUpPost.h"
#include "core/scheduling/KVRScheduler.h"
#include "core/warranty/LookupPolicy.h"
#include "platform/names/Names.h"

namespace kvr {

std::shared_ptr<KVRPairedDevicesMonitor> KVRPairedDevicesMonitor::initWithAgent(Platform& platform,
                                                                                DeviceInfosQuery agent) {
  return std::make_shared<KVRPairedDevicesMonitor>(platform, std::move(agent));
}

KVRPairedDevicesMonitor::KVRPairedDevicesMonitor(Platform& platform, DeviceInfosQuery theAgent)
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
  pairNotifyToken = platform_.notifications.registerFor(names::kDeviceDidPair, handler);
  unpairNotifyToken = platform_.notifications.registerFor(names::kDeviceDidUnpair, handler);
}

void KVRPairedDevicesMonitor::_pairedOrActiveDevicesDidChange() {
  platform_.log.standard("%s", "-[KVRPairedDevicesMonitor _pairedOrActiveDevicesDidChange:]");
  _updatePariedDevicesFollowUp();
}

void KVRPairedDevicesMonitor::_updatePariedDevicesFollowUp() {
  const auto turn = refreshes_.begin([self = shared_from_this()] { self->_updatePariedDevicesFollowUp(); });
  if (!turn) return;
  agent()(LookupPolicy::kDefault, true,
          DeviceInfosAnswer(
              platform_.log, "_updatePariedDevicesFollowUp",
              [self = shared_from_this(), turn](const std::optional<KVRDeviceInfoList>& deviceInfos) {
                self->platform_.log.standard(
                    "Devices followups to be posted, if required, after paired device change");
                if (deviceInfos) self->schedulePost(*deviceInfos);
              }));
}

void KVRPairedDevicesMonitor::schedulePost(const KVRDeviceInfoList& deviceInfos) {
  const auto date = KVRFollowUpPost::nextFollowUpPostDateWithDevicesInfo(platform_, deviceInfos);
  if (!date) return;
  platform_.log.standard(
      "Watch paired after phone's refreshActivity has already finished. Schedule followUp post for: %@",
      date);
  KVRScheduler::newSchedulerForActivity(platform_, names::kFollowUpPost)->scheduleActivityForDate(date);
}

}  // namespace kvr
