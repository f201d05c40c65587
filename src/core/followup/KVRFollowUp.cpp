// Posting, dismissing and clearing, and the migration of the follow-up of earlier versions.

#include "core/followup/KVRFollowUp.h"

#include "core/followup/DeviceFacts.h"
#include "core/followup/FollowUpKeys.h"
#include "core/followup/HashList.h"
#include "core/followup/KVRDefaultFolllowUpProvider.h"
#include "core/followup/OutcomeText.h"
#include "platform/names/Names.h"
#include "platform/text/SHA256Hash.h"

namespace kvr {
namespace {

constexpr const char* kPosting = "-[KVRFollowUp _postFollowUpWithDevicesInfo:repostAllowed:]";

}  // namespace

KVRFollowUp::KVRFollowUp(Platform& platform)
    : KVRFollowUp(platform, std::make_shared<KVRDefaultFolllowUpProvider>(platform)) {}

KVRFollowUp::KVRFollowUp(Platform& platform, std::shared_ptr<KVRFollowUpProvider> theFollowUpProvider)
    : followUpProvider(std::move(theFollowUpProvider)), platform_(platform) {}

Turn KVRFollowUp::takeTurn() const {
  struct FollowUpTurns {
    std::shared_ptr<Turns> turns;
  };
  const auto shared = platform_.sharedObjects.get<FollowUpTurns>(
      [this] { return new FollowUpTurns{platform_.queues.newTurns("follow-ups")}; });
  return Turn(*shared->turns);
}

std::vector<FollowUpItem> KVRFollowUp::pendingItems() {
  auto items = followUpProvider()->pendingFollowUpItems();
  if (items) return *std::move(items);
  platform_.log.error("Error loading pending follow-ups: %@", items.error());
  return {};
}

std::size_t KVRFollowUp::pendingFollowUpCount() { return pendingItems().size(); }

bool KVRFollowUp::postFollowUpWithDevicesInfo(const KVRDeviceInfoList& devicesInfo) {
  return _postFollowUpWithDevicesInfo(devicesInfo, false);
}

bool KVRFollowUp::_postFollowUpWithDevicesInfo(const KVRDeviceInfoList& devicesInfo, bool repostAllowed) {
  const auto turn = takeTurn();
  KVRDeviceInfoList toPost;
  for (const auto& info : devicesInfo) {
    if (isToPost(*info, repostAllowed)) toPost.push_back(info);
  }
  for (const auto& info : toPost) postFollowUpWithDeviceInfo(*info);
  return !toPost.empty();
}

bool KVRFollowUp::isToPost(const KVRDeviceInfo& deviceInfo, bool repostAllowed) {
  auto& log = platform_.log;
  const auto device = deviceInfo.device();
  const auto hash = serialHashOf(deviceInfo);
  const bool isDismissed =
      hash && HashList(platform_.preferences, preference::kFollowUpDismissedHashes).contains(*hash);
  switch (postingOutcome(offerFactsOf(deviceInfo), platform_.clock.now(), isDismissed, repostAllowed,
                         [&] { return _checkConversionEligibilityForDevice(deviceInfo); })) {
    case PostingOutcome::NoWarranty:
      log.standard("%s: No warranty downloaded for device. Don't post a followup for %{private}@", kPosting,
                   device);
      return false;
    case PostingOutcome::NotOffered:
      log.standard("%s: Device NOT eligible. Don't post a followup for %{private}@", kPosting, device);
      return false;
    case PostingOutcome::Ended:
      log.standard("%s: Device no longer eligible. Don't post a followup for %{private}@", kPosting, device);
      return false;
    case PostingOutcome::Dismissed:
      log.standard("%s: Followup already dismissed for %{private}@, leaving unposted", kPosting, device);
      return false;
    case PostingOutcome::Eligible:
      break;
  }
  return isDue(deviceInfo);
}

bool KVRFollowUp::isDue(const KVRDeviceInfo& deviceInfo) {
  auto& log = platform_.log;
  const auto due = postDate(offerFactsOf(deviceInfo));
  if (due.isActivationDate) {
    log.standard("%s: Using initial postdate as it is later than FollowupDisplay Date", kPosting);
  }
  if (due.isInFuture(platform_.clock.now())) {
    log.standard("%s: Device eligible with future post date. Cannot post followup for %{private}@ on: %@",
                 kPosting, deviceInfo.device(), due.date);
    return false;
  }
  log.standard("%s: Device eligible. Post new  followup for %{private}@", kPosting, deviceInfo.device());
  return true;
}

void KVRFollowUp::postFollowUpWithDeviceInfo(const KVRDeviceInfo& deviceInfo) {
  const auto turn = takeTurn();
  const auto warranty = deviceInfo.warranty();
  const auto serialNumber = serialNumberOf(deviceInfo);
  if (!warranty || !warranty->zubOfferDisplay() || !serialNumber) {
    platform_.log.error("Failed to post follow-up:%@%@", warranty ? "" : "<Missing warranty>",
                        serialNumber ? "" : "<Missing serial number>");
    return;
  }
  const auto error = followUpProvider()->postFollowUpItem(newFollowUpItem(deviceInfo));
  platform_.log.standard("Posted follow-up: serialNumber:%@ -> %@", *serialNumber, outcomeText(error));
  if (error) return;
  HashList(platform_.preferences, preference::kFollowUpPostedHashes).insert(sha256Hash(*serialNumber));
}

bool KVRFollowUp::_checkConversionEligibilityForDevice(const KVRDeviceInfo& deviceInfo) {
  const auto hash = serialHashOf(deviceInfo);
  if (!hash) return false;
  const auto dismissed = platform_.preferences.dateForKey(*hash + names::kDismissedSuffix);
  const auto displayDate = offerFactsOf(deviceInfo).displayDate;
  switch (conversionOutcome(dismissed, displayDate)) {
    case ConversionOutcome::NeverDismissed:
    case ConversionOutcome::NoDisplayDate:
      return false;
    case ConversionOutcome::DismissedSince:
      platform_.log.debug(
          "Device not eligible for conversion. %{private}@, followup dismissed date: %@, fup display date: "
          "%@",
          deviceInfo.device(), dismissed, displayDate);
      return false;
    case ConversionOutcome::DismissedBefore:
      break;
  }
  HashList(platform_.preferences, preference::kFollowUpPostedHashes).remove(*hash);
  return true;
}

void KVRFollowUp::dismissFollowUpForSerialNumber(const std::string& serialNumber) {
  const auto turn = takeTurn();
  const auto error = followUpProvider()->clearPendingFollowUpItemsWithUniqueIdentifiers(
      {uniqueIdentfierForSerialNumber(serialNumber)});
  platform_.log.standard("Dismissed follow-up: %@", outcomeText(error));
  if (error) return;
  const auto hash = sha256Hash(serialNumber);
  HashList(platform_.preferences, preference::kFollowUpDismissedHashes).append(hash);
  platform_.preferences.setObject(platform_.clock.now(), hash + names::kDismissedSuffix);
}

void KVRFollowUp::_clearFollowUpWithDevices(const std::vector<KVRDeviceRef>& devices) {
  const auto turn = takeTurn();
  std::vector<std::string> identifiers;
  identifiers.reserve(devices.size());
  for (const auto& device : devices) {
    identifiers.push_back(uniqueIdentfierForSerialNumber(device ? device->serialNumber() : std::nullopt));
  }
  const auto error = followUpProvider()->clearPendingFollowUpItemsWithUniqueIdentifiers(identifiers);
  platform_.log.standard("Cleared follow-up: %@", outcomeText(error));
}

void KVRFollowUp::migrateLegacyFollowUpIfNeededWithDeviceInfo(const KVRDeviceInfo& deviceInfo) {
  const auto turn = takeTurn();
  auto& log = platform_.log;
  auto items = pendingItems();
  if (items.size() != 1 || items[0].uniqueIdentifier != names::kFollowUpClient) return;
  // Without a serial number the follow-up cannot be assigned to a device.
  const auto serialNumber = serialNumberOf(deviceInfo);
  if (deviceInfo.warranty() && serialNumber) {
    log.standard("Migrating legacy followup..");
    auto& item = items[0];
    item.uniqueIdentifier = uniqueIdentfierForSerialNumber(serialNumber);
    _setupFollowUpItem(item, deviceInfo);
    if (const auto error = followUpProvider()->postFollowUpItem(item)) {
      log.error("Error posting migrated follow-up: %@", *error);
    }
  } else {
    log.standard("Clearing legacy followup, no legacy warranty was found..");
  }
  const auto error =
      followUpProvider()->clearPendingFollowUpItemsWithUniqueIdentifiers({names::kFollowUpClient});
  if (error) log.error("Error clearing legacy follow-up: %@", *error);
}

}  // namespace kvr
