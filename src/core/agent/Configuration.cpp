#include "core/agent/Configuration.h"

#include "core/agent/AgentKeys.h"
#include "core/warranty/WarrantyKeys.h"

namespace kvr {

void kvr_registerDefaults(Preferences& preferences) {
  const std::string service = std::string("https://") + kCoverageServiceHost;
  const std::string assets = std::string("https://") + kAssetHost;
  preferences.registerDefaults({
      {preference::kCachedWarrantyValidityDuration, 86400},
      {preference::kHighServerVersion, 3},
      {preference::kLowServerVersion, 2},
      {preference::kOneDayInterval, 86400},
      {preference::kPostUpgradeOutreachDelay, 3600},
      {preference::kServerVersionURL, assets + "/library/TARSIL/asset/kvrV2.plist"},
      {preference::kWarrantyURL, service + "/api/v3/coverage/summary"},
      {preference::kWearablesWarrantyURL, service + "/api/v2/coverage/summary"},
  });
}

}  // namespace kvr
