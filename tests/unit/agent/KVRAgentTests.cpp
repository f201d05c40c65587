#include "core/agent/KVRAgent.h"
#include "core/agent/KVRAgentDefaultWarrantyProvider.h"
#include "platform/codec/JSON.h"
#include "unit/CoverageWorld.h"

#include <latch>
#include <thread>

namespace kvr {
namespace {

struct AnAgent : CoverageTest {
  static std::string serialNumberIn(const HTTPRequest& request) {
    return (*readJSON(request.body))["serialNumber"].string();
  }
  /// The reply is set once the queues have run.
  std::shared_ptr<std::optional<KVRDeviceInfoList>> allInfos() {
    auto reply = std::make_shared<std::optional<KVRDeviceInfoList>>();
    agent->getAllDeviceInfosUsingPolicy(
        LookupPolicy::kRefresh, true,
        DeviceInfosReply(world.log, "test", [reply](const KVRDeviceInfoList& list) { *reply = list; }));
    return reply;
  }
  KVRDeviceInfoRef info(const std::string& serialNumber, std::uint64_t policy) {
    KVRDeviceInfoRef reply;
    agent->getDeviceInfoForSerialNumber(
        serialNumber, policy,
        DeviceInfoReply(world.log, "test", [&](const KVRDeviceInfoRef& it) { reply = it; }));
    world.queues.run();
    return reply;
  }
  std::optional<bool> accountAdded() {
    added.reset();
    agent->tarsilAccountAdded(BoolReply(world.log, "test", [this](bool yes) { added = yes; }));
    world.queues.run();
    return added;
  }

  std::shared_ptr<KVRAgent> agent =
      KVRAgent::initWithCallingProcessBundleID(world.platform, "com.example.client");
  std::optional<bool> added;  ///< the last reply
};

TEST_F(AnAgent, AnswersOverlappingCallsAfterTheLookupsOfBothWithOneRecordADevice) {
  for (int i = 0; i < 50; ++i) world.pair("W" + std::to_string(i));
  std::vector<SimulatedHTTP::Answer> held;
  const auto plain = world.http.handler;
  world.http.handler = [&](const HTTPRequest& request, bool uncached, const SimulatedHTTP::Answer& answer) {
    if (held.empty() && request.method == "POST") return held.push_back(answer);
    plain(request, uncached, answer);
  };
  int asked = 0;
  world.coverage = [&](const HTTPRequest& request) {
    return ++asked % 2 == 0 ? HTTPResponse{500, "{}", {}}
                            : HTTPResponse{200, "{\"quorURL\":\"" + serialNumberIn(request) + "\"}", {}};
  };
  const auto first = allInfos();
  world.queues.run();
  const auto second = allInfos();
  world.queues.run();
  EXPECT_FALSE(first->has_value() || second->has_value()) << "the group is the agent's";
  held.at(0)({500, "{}", {}});
  world.queues.run();
  ASSERT_TRUE(first->has_value() && second->has_value());
  std::size_t withWarranty = 0;
  for (const auto& list : {**first, **second}) {
    std::set<std::string> serialNumbers;
    for (const auto& record : list) {
      const auto serialNumber = *record->device()->serialNumber();
      serialNumbers.insert(serialNumber);
      if (!record->warranty()) continue;
      ++withWarranty;
      EXPECT_EQ(record->warranty()->quorURL(), Value(serialNumber)) << "each its own";
    }
    EXPECT_THAT(serialNumbers, SizeIs(51));
    EXPECT_THAT(list, SizeIs(51));
  }
  EXPECT_EQ(withWarranty, 51U);
}

TEST_F(AnAgent, MapsSerialNumbersThroughTheTwoTables) {
  world.preferences.setObject(Dictionary{{"S", "T"}, {"X", "Z"}, {"bad", 7}},
                              "PairedBluetoothDevicesSerialNumbers");
  EXPECT_EQ(*info("S", 2)->device()->serialNumber(), "T");
  EXPECT_EQ(serialNumberIn(world.http.requests().back().request), "T");
  EXPECT_TRUE(world.log.contains("serialNumberOverride for Serial Number: S with serial: T"));
  EXPECT_TRUE(world.log.contains("Override Serial Number: T found for SN: S"));
  world.preferences.setObject(Dictionary{{"X", "Y"}}, "PairedWatchesSerialNumbers");
  EXPECT_EQ(*info("X", 1)->device()->serialNumber(), "Y");
  EXPECT_EQ(*info("bad", 1)->device()->serialNumber(), "bad");
  EXPECT_EQ(*info("none", 1)->device()->serialNumber(), "none");
  EXPECT_TRUE(world.log.contains("serialNumberOverride for Serial Number: none with serial: (null)"));
}

TEST_F(AnAgent, RefreshesAfterAnAccountWasAddedOnceTheFirstOutreachIsScheduled) {
  world.preferences.registerDefaults({{"PostUpgradeOutreachDelay", 3600}});
  EXPECT_EQ(accountAdded(), false);
  EXPECT_TRUE(world.log.contains(
      "-[KVRAgent tarsilAccountAddedWithReply:]: Skipped scheduling/downloading new warranty"));
  EXPECT_FALSE(world.preferences.boolForKey("InitialOutreachActivityScheduled"));

  world.preferences.setObject(true, "PostUpgradeActivityCompleted");
  EXPECT_EQ(accountAdded(), true);
  EXPECT_TRUE(world.log.contains("Outreach to be scheduled after: 3600.000000"));
  EXPECT_TRUE(world.preferences.boolForKey("InitialOutreachActivityScheduled"));
  EXPECT_THAT(world.http.requests(), IsEmpty());

  EXPECT_EQ(accountAdded(), std::nullopt) << "the reply waits for the downloads";
  EXPECT_TRUE(world.log.contains("New warranty to be downloaded after: 3600.000000"));
  agent.reset();
  world.queues.advance(3599);
  EXPECT_THAT(world.http.requests(), IsEmpty());
  world.queues.advance(1);
  EXPECT_EQ(added, true);
  EXPECT_THAT(world.http.requests(), SizeIs(2));
}

TEST_F(AnAgent, HandsOutTheWebURLOverrideOnInternalInstallationsOnly) {
  world.preferences.setObject("https://flow.example", preference::kWebFlowURL);
  std::vector<Value> replies;
  const auto ask = [&] {
    agent->readWebURLOverride(
        StringReply(world.log, "test", [&](const Value& url) { replies.push_back(url); }));
  };
  ask();
  world.deviceProperties.internalInstall = true;
  ask();
  agent->readWebURLOverride(std::nullopt);
  EXPECT_THAT(replies, ElementsAre(Value(), Value("https://flow.example")));
  EXPECT_EQ(world.log.count("readWebURLOverride = https://flow.example"), 2U);
}

/// Keeps the answers to downloads until the test gives them.
struct LateProvider : KVRAgentDefaultWarrantyProvider {
  using KVRAgentDefaultWarrantyProvider::KVRAgentDefaultWarrantyProvider;

  void downloadWarrantyForSerialNumber(const std::string&, DownloadCompletion handler) override {
    handlers.push_back(std::move(handler));
  }
  std::vector<DownloadCompletion> handlers;
};

TEST_F(AnAgent, LosesNoAnswerOfThoseThatComeOnManyThreadsAtOnce) {
  constexpr std::ptrdiff_t kThreads = 8;
  for (int i = 0; i < 400; ++i) world.pair("W" + std::to_string(i));
  const auto provider = std::make_shared<LateProvider>(world.platform, "client");
  agent->warrantyProvider = std::shared_ptr<KVRAgentWarrantyProvider>(provider);
  const auto reply = allInfos();
  world.queues.run();
  std::latch together(kThreads);
  std::vector<std::thread> threads;
  for (std::size_t first = 0; first < kThreads; ++first) {
    threads.emplace_back([&, first] {
      together.arrive_and_wait();
      for (auto i = first; i < provider->handlers.size(); i += kThreads)
        provider->handlers[i](false, nullptr);
    });
  }
  for (auto& thread : threads) thread.join();
  world.queues.run();
  ASSERT_TRUE(reply->has_value());
  std::set<std::string> serialNumbers;
  for (const auto& record : **reply) serialNumbers.insert(*record->device()->serialNumber());
  EXPECT_THAT(serialNumbers, SizeIs(401));
  EXPECT_THAT(**reply, SizeIs(401));
}

}  // namespace
}  // namespace kvr
