#include "AgentPreferences.h"

#include "local/system/LocalClock.h"
#include "local/system/LocalFiles.h"
#include "local/system/LocalLog.h"
#include "platform/names/Names.h"
#include "platform/stores/FilePreferences.h"

#include <algorithm>

namespace kvr::coverage_service {

bool directAgentTo(const std::string& url) {
  const auto log = LocalLog::fromEnvironment();
  const LocalClock clock;
  LocalFiles files(*log);
  PropertyListFiles lists(files, clock, *log);
  FilePreferences preferences(lists, *log, names::kAgent);
  const Value::Dictionary urls{{"ServerVersionURL", url + "/library/TARSIL/asset/kvrV2.plist"},
                               {"WarrantyURL", url + "/api/v3/coverage/summary"},
                               {"WearablesWarrantyURL", url + "/api/v2/coverage/summary"}};
  preferences.setObjects(urls);
  return std::ranges::all_of(
      urls, [&](const auto& entry) { return preferences.objectForKey(entry.first) == entry.second; });
}

}  // namespace kvr::coverage_service
