#include "core/monitors/KVRLocaleMonitor.h"

#include "core/followup/KVRFollowUp.h"
#include "core/warranty/LookupPolicy.h"
#include "platform/names/Names.h"

namespace kvr {
namespace {

constexpr double kCheckDelay = 5;  // seconds

}  // namespace

std::shared_ptr<KVRLocaleMonitor> KVRLocaleMonitor::initWithAgent(Platform& platform,
                                                                  DeviceInfosQuery agent) {
  return std::make_shared<KVRLocaleMonitor>(platform, std::move(agent));
}

KVRLocaleMonitor::KVRLocaleMonitor(Platform& platform, DeviceInfosQuery theAgent)
    : agent(std::move(theAgent)),
      platform_(platform),
      refreshes_(platform.log, platform.queues.mainQueue()) {}

KVRLocaleMonitor::~KVRLocaleMonitor() { platform_.notifications.cancel(_languageNotifyToken); }

void KVRLocaleMonitor::start() {
  _languageNotifyToken = platform_.notifications.registerFor(
      names::kLanguageChanged, [&platform = platform_, monitor = weak_from_this()] {
        platform.queues.after(kCheckDelay, platform.queues.mainQueue(), [monitor] {
          if (const auto self = monitor.lock()) self->localeDidChange();
        });
      });
}

void KVRLocaleMonitor::localeDidChange() {
  if (KVRFollowUp(platform_).pendingFollowUpCount() == 0) return platform_.cleanExit.requestWhenIdle();
  const auto turn = refreshes_.begin([monitor = weak_from_this()] {
    if (const auto self = monitor.lock()) self->localeDidChange();
  });
  if (!turn) return;
  platform_.log.standard(
      "Locale changed and one or more followups are being displayed. Refresh warranty if needed.");
  agent()(LookupPolicy::kDefault, true,
          DeviceInfosAnswer(platform_.log, "localeDidChange",
                            [&platform = platform_, turn](const std::optional<KVRDeviceInfoList>&) {
                              platform.log.standard("Device infos refreshed after locale change");
                              platform.cleanExit.requestWhenIdle();
                            }));
}

}  // namespace kvr
