// Building one device's follow-up item.

#include "core/followup/DeviceFacts.h"
#include "core/followup/FollowUpKeys.h"
#include "core/followup/KVRFollowUp.h"
#include "platform/names/Names.h"
#include "platform/text/SHA256Hash.h"

namespace kvr {
namespace {

constexpr const char* kSetup = "-[KVRFollowUp _setupFollowUpItem:withDeviceInfo:]";

// Bits of the display style. None is ever cleared.
constexpr std::uint64_t kRowBadge = 1;
constexpr std::uint64_t kNewItem = 2;
constexpr std::uint64_t kNoRowBadge = 16;

constexpr double kExpirationMargin = 0.001;  // seconds before the eligibility's end

}  // namespace

std::string KVRFollowUp::uniqueIdentfierForSerialNumber(const std::optional<std::string>& serialNumber) {
  const std::string prefix = names::kFollowUpClient;
  return serialNumber ? prefix + "." + sha256Hash(*serialNumber) : prefix;
}

FollowUpItem KVRFollowUp::newFollowUpItem(const KVRDeviceInfo& deviceInfo) const {
  FollowUpItem item;
  item.uniqueIdentifier = uniqueIdentfierForSerialNumber(serialNumberOf(deviceInfo));
  item.groupIdentifier = kFollowUpGroupIdentifier;
  switch (deviceInfo.device()->deviceType()) {
    case KVRDevice::kWatch:
      item.targetBundleIdentifier = kWatchCompanionBundleIdentifier;
      break;
    case KVRDevice::kLocal:
      item.targetBundleIdentifier = kFollowUpSettingsBundleIdentifier;
      break;
    default:
      break;
  }
  item.extensionIdentifier = kFollowUpExtensionIdentifier;
  item.displayStyle = kNewItem;
  _setupFollowUpItem(item, deviceInfo);
  return item;
}

void KVRFollowUp::_setupFollowUpItem(FollowUpItem& item, const KVRDeviceInfo& withDeviceInfo) const {
  platform_.log.standard("%s: %{private}@", kSetup, withDeviceInfo);
  const auto warranty = withDeviceInfo.warranty();
  const auto end = warranty->zubOfferEligibleUntil();
  item.title = warranty->zubLocalizedOfferLabel();
  item.informativeFooterText = warranty->zubLocalizedOfferDesc();
  item.expirationDate = end ? std::optional(*end - kExpirationMargin) : std::nullopt;
  const bool shouldShowRowBadge =
      showsRowBadge(warranty->zubOfferSettingsRowBadge(), end, warranty->zubOfferBadgeDurationBeforeEndDate(),
                    platform_.clock.now());
  platform_.log.standard("%s: shouldShowRowBadge: %d", kSetup, shouldShowRowBadge);
  item.displayStyle |= shouldShowRowBadge ? kRowBadge : kNoRowBadge;
  item.userInfo = userInfoFor(*warranty, serialNumberOf(withDeviceInfo).value());
  item.actions = {{warranty->zubLocalizedOfferCTA(), std::nullopt}};
}

Value::Dictionary KVRFollowUp::userInfoFor(const KVRWarranty& warranty,
                                           const std::string& serialNumber) const {
  Value::Dictionary userInfo{{names::kFollowUpSerialNumber, serialNumber},
                             {kFollowUpRelativeDateCeilingKey, true}};
  const auto singular = warranty.zubLocalizedOfferSingularDesc();
  if (singular.isNull()) {
    platform_.log.error("Missing zubLocalizedOfferSingularDesc value");
  } else {
    userInfo.emplace(kFollowUpRelativeDateSingleDayKey, singular);
  }
  const auto plural = warranty.zubLocalizedOfferPluralDescFormat();
  if (plural.isNull()) {
    platform_.log.error("Missing zubLocalizedOfferPluralDescFormat value");
  } else {
    userInfo.emplace(kFollowUpRelativeDatePluralDaysFormatKey, plural);
  }
  return userInfo;
}

}  // namespace kvr
