#include "core/outreach/KVROutreachActivityUtilities.h"

#include "core/devices/KVRDevicesManager.h"
#include "core/followup/DeviceFacts.h"
#include "core/outreach/OutreachRules.h"
#include "core/outreach/WarrantyDownloads.h"
#include "core/scheduling/KVRScheduler.h"
#include "core/warranty/WarrantyKeys.h"
#include "platform/names/Names.h"

namespace kvr {
namespace {

std::string describeSubscriptions(const std::map<std::string, Carrier>& subscriptions) {
  std::string text = "{";
  for (const auto& [subscription, carrier] : subscriptions) {
    text += subscription + " = " + describe(carrier) + "; ";
  }
  return text + "}";
}

}  // namespace

void KVROutreachActivityUtilities::performOutreachActivityForConversion(
    bool conversion, const std::shared_ptr<KVRScheduler>& withScheduler,
    const ActivityHandler& andCompletion) {
  outreachInProgress = true;
  const auto answer = std::make_shared<RunAnswer>(platform_.log, andCompletion);
  outReachTimer = newDeferCheck<KVROutreachActivityUtilities>(
      platform_.queues, weak_from_this(), answer, withScheduler,
      [conversion](KVROutreachActivityUtilities& self, RunAnswer& pending) {
        if (self.outreachInProgress) self.defer(conversion, pending);
      });
  std::vector<KVRDeviceRef> devices;
  for (const auto& [serialNumber, device] : KVRDevicesManager::sharedManager(platform_)->allDevices()) {
    devices.push_back(device);
  }
  platform_.log.standard(
      "%s: -- Conversion: %d -- devices: %@",
      "-[KVROutreachActivityUtilities performOutreachActivityForConversion:withScheduler:andCompletion:]",
      conversion, devices);
  const auto downloader = newWarrantyDownloader(platform_, kPreferencesBundleID);
  const auto self = shared_from_this();
  for (const auto& device : devices) {
    const auto serialNumber = device->serialNumber();
    downloads_.enter();
    // Owned by the completion, so the run stops waiting for this download even if it never answers.
    const std::shared_ptr<void> entered(nullptr, [self](void*) { self->downloads_.leave(); });
    downloader->downloadWarrantyForSerialNumber(
        serialNumber, DownloadCompletion(platform_.log, "performOutreachActivity",
                                         [self, entered, serialNumber, conversion](
                                             bool success, const KVRWarrantyRef& warranty) {
                                           self->handleDownload(serialNumber, success, warranty, conversion);
                                         }));
  }
  downloads_.notify(platform_.queues.concurrentQueue(Priority::Default), [self, conversion, answer] {
    if (!self->platform_.cleanExit.isEnding()) return self->finish(conversion, *answer);
    self->outreachInProgress = false;
    self->defer(conversion, *answer);
  });
}

void KVROutreachActivityUtilities::defer(bool conversion, RunAnswer& answer) {
  platform_.log.standard("Warranty download activity deferred. Conversion: %d", conversion);
  stopDeferCheck();
  answer.give(ActivityResult::Deferred);
}

void KVROutreachActivityUtilities::stopDeferCheck() {
  if (const auto timer = outReachTimer()) timer->invalidate();
  outReachTimer = nullptr;
}

void KVROutreachActivityUtilities::handleDownload(const std::optional<std::string>& serialNumber,
                                                  bool success, const KVRWarrantyRef& warranty,
                                                  bool conversion) {
  auto& log = platform_.log;
  log.standard("serialNumber: %@ success: %d -- Conversion: %d", serialNumber, success, conversion);
  if (!success || !warranty) {
    log.error("Warranty failed to download");
    return;
  }
  log.standard("Warranty downloaded successfully");
  if (!warranty->zubOfferDisplay()) {
    log.standard("Warranty shows device is ineligible, complete activity without scheduling followup");
    return;
  }
  log.standard("Coverage check shows device should display Zub offer, check on-device state");
  if (!currentDeviceShouldReceiveOutreachForWarranty(*warranty)) {
    log.standard(
        "Configuration does not support current device. Complete activity without scheduling followup");
    return;
  }
  const auto candidate = displayDateOf(offerFactsOf(*warranty));
  const auto now = platform_.clock.now();
  const std::lock_guard lock(mutex_);
  earliestPostDate_ = earlierPostDate(earliestPostDate_, candidate, now);
}

void KVROutreachActivityUtilities::finish(bool conversion, RunAnswer& answer) {
  std::optional<Date> postDate;
  {
    const std::lock_guard lock(mutex_);
    postDate = earliestPostDate_;
  }
  if (postDate) {
    platform_.log.standard("Conversion: %d -- Complete activity and schedule followUp post for: %@",
                           conversion, *postDate);
    KVRScheduler::newSchedulerForActivity(platform_, names::kFollowUpPost)->scheduleActivityForDate(postDate);
  } else {
    platform_.log.standard("Conversion: %d -- No devices eligible for followUp posts", conversion);
  }
  outreachInProgress = false;
  stopDeferCheck();
  answer.give(ActivityResult::Finished);
}

bool KVROutreachActivityUtilities::currentDeviceShouldReceiveOutreachForWarranty(
    const KVRWarranty& warranty) const {
  auto& log = platform_.log;
  const auto subscriptions = platform_.carriers.subscriptions();
  for (const auto& [subscription, carrier] : subscriptions) {
    if (!carrier.mobileCountryCode) {
      log.error("No mobileCountryCode for networkInfo: %@, carrier: %@", describeSubscriptions(subscriptions),
                describe(carrier));
    }
    const auto identifier = carrierID(carrier);
    log.standard("carrierID: %@", identifier);
    if (excludesCarrier(warranty.zubOfferToggle(), identifier)) {
      log.standard("carrier matched");
      return false;
    }
  }
  return true;
}

}  // namespace kvr
