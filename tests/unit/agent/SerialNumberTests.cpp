#include "core/agent/KVRAgent.h"
#include "core/followup/KVRFollowUp.h"
#include "core/followup/KVRFollowUpPost.h"
#include "core/outreach/KVROutreachActivity.h"
#include "platform/codec/JSON.h"
#include "unit/OddSerialNumbers.h"
#include "unit/OfferWorld.h"

namespace kvr {
namespace {

struct AnySerialNumber : AnOfferTest {
  AnySerialNumber() {
    world.coverage = [this](const HTTPRequest& request) {
      EXPECT_THAT(request.url, HasSubstr("/api/v3/")) << "the local device's endpoint";
      asked.insert((*readJSON(request.body))["serialNumber"].string());
      return HTTPResponse{200, *writeJSON(due(10)), {}};
    };
  }
  /// Gives the local device this serial number and the files of an earlier version.
  void become(const std::string& serialNumber) {
    world.deviceProperties.answers["SerialNumber"] = serialNumber;
    world.preferences.removeObject(preference::kMigrationVersion);
    KVRWarranty::initWithDictionary(world.platform, offer(10))->cache();
    asked.clear();
    world.log.clear();
  }
  /// The serial number in the answer, and whether it has a warranty.
  std::pair<std::optional<std::string>, bool> lookUp(const std::string& serialNumber, std::uint64_t policy) {
    KVRDeviceInfoRef info;
    agent->getDeviceInfoForSerialNumber(
        serialNumber, policy,
        DeviceInfoReply(world.log, "test", [&](const KVRDeviceInfoRef& it) { info = it; }));
    world.queues.run();
    return {info->device()->serialNumber(), info->warranty() != nullptr};
  }
  void dismiss(const std::string& serialNumber) {
    agent->dismissFollowUpForSerialNumber(serialNumber, BoolReply(world.log, "test", [](bool) {}));
  }

  const std::shared_ptr<KVRAgent> agent = KVRAgent::initWithCallingProcessBundleID(world.platform, "client");
  std::set<std::string> asked;  ///< the serial numbers in requests to the service
};

TEST_F(AnySerialNumber, IsMigratedLookedUpPostedRefreshedAndDismissedAsItIs) {
  for (const auto& serialNumber : oddSerialNumbers()) {
    SCOPED_TRACE(describe(Value(serialNumber.substr(0, 20))));
    become(serialNumber);
    const auto known = std::pair(std::make_optional(serialNumber), true);
    agent->performMigrationIfNeeded();
    EXPECT_TRUE(KVRWarranty::cachedWarrantyForSerialNumber(world.platform, serialNumber));
    EXPECT_FALSE(KVRWarranty::cachedWarrantyForSerialNumber(world.platform, {})) << "none is not empty";

    EXPECT_EQ(lookUp(serialNumber, LookupPolicy::kRefresh), known);
    EXPECT_EQ(lookUp(serialNumber, LookupPolicy::kDefault), known) << "from the cache";
    start<KVROutreachActivity>();
    world.queues.run();
    EXPECT_TRUE(world.log.contains("serialNumber: " + serialNumber + " success: 1 -- Conversion: 0"));
    start<KVRFollowUpPost>(newAgentQuery(world.platform));
    world.queues.run();
    EXPECT_THAT(asked, ElementsAre(serialNumber));
    EXPECT_THAT(pendingSerials(), ElementsAre(serialNumber));
    EXPECT_THAT(hashes(preference::kFollowUpPostedHashes), Contains(Value(sha256Hash(serialNumber))));

    lookUp(serialNumber, LookupPolicy::kDefault);
    EXPECT_EQ(world.log.count("Updated follow-up: success"), 1U);
    dismiss(serialNumber);
    start<KVRFollowUpPost>(newAgentQuery(world.platform));
    world.queues.run();
    EXPECT_THAT(pending(), IsEmpty());
    EXPECT_THAT(hashes(preference::kFollowUpDismissedHashes), Contains(Value(sha256Hash(serialNumber))));
    EXPECT_THAT(world.log.texts(LogLevel::Error), IsEmpty());
  }
}

}  // namespace
}  // namespace kvr
