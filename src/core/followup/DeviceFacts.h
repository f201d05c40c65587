#pragma once

#include "core/devices/KVRDeviceInfo.h"
#include "core/followup/FollowUpDates.h"
#include "core/followup/FollowUpRules.h"

#include <optional>
#include <string>

namespace kvr {

std::optional<std::string> serialNumberOf(const KVRDeviceInfo& deviceInfo);
/// The hash of the serial number, the key for what is stored about follow-ups.
std::optional<std::string> serialHashOf(const KVRDeviceInfo& deviceInfo);
/// The facts that the rules need, as of now.
OfferFacts offerFactsOf(const KVRDeviceInfo& deviceInfo);
/// The same of a warranty alone, without an activation date.
OfferFacts offerFactsOf(const KVRWarranty& warranty);
std::vector<FollowUpDateFacts> dateFactsOf(Platform& platform, const KVRDeviceInfoList& deviceInfos);

}  // namespace kvr
