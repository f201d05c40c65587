#include "core/followup/DeviceFacts.h"

#include "core/followup/FollowUpKeys.h"
#include "core/followup/HashList.h"
#include "platform/text/SHA256Hash.h"

namespace kvr {

std::optional<std::string> serialNumberOf(const KVRDeviceInfo& deviceInfo) {
  const auto device = deviceInfo.device();
  return device ? device->serialNumber() : std::nullopt;
}

std::optional<std::string> serialHashOf(const KVRDeviceInfo& deviceInfo) {
  const auto serialNumber = serialNumberOf(deviceInfo);
  return serialNumber ? std::optional(sha256Hash(*serialNumber)) : std::nullopt;
}

OfferFacts offerFactsOf(const KVRDeviceInfo& deviceInfo) {
  const auto warranty = deviceInfo.warranty();
  auto facts = warranty ? offerFactsOf(*warranty) : OfferFacts{};
  if (const auto device = deviceInfo.device()) facts.activationDate = device->activationDate();
  return facts;
}

OfferFacts offerFactsOf(const KVRWarranty& warranty) {
  OfferFacts facts;
  facts.hasWarranty = true;
  facts.isOffered = warranty.zubOfferDisplay();
  facts.eligibleUntil = warranty.zubOfferEligibleUntil();
  facts.displayDate = warranty.zubOfferFollowupDisplayDate();
  facts.durationBeforeEnd = warranty.zubOfferDurationBeforeEndDate();
  return facts;
}

std::vector<FollowUpDateFacts> dateFactsOf(Platform& platform, const KVRDeviceInfoList& deviceInfos) {
  const HashList posted(platform.preferences, preference::kFollowUpPostedHashes);
  std::vector<FollowUpDateFacts> devices;
  devices.reserve(deviceInfos.size());
  for (const auto& info : deviceInfos) {
    const auto hash = serialHashOf(*info);
    const auto warranty = info->warranty();
    devices.push_back(
        {offerFactsOf(*info), hash && posted.contains(*hash), warranty ? warranty->daysEligible() : 0});
  }
  return devices;
}

}  // namespace kvr
