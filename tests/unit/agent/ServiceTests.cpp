#include "agent/AgentKeys.h"
#include "agent/KVRAgentProtocol.h"
#include "agent/StartUp.h"
#include "unit/CoverageWorld.h"

namespace kvr {
namespace {

using ::testing::IsEmpty;

class TheService : public ::testing::Test {
 protected:
  void TearDown() override {
    world.queues.run();
    EXPECT_THAT(world.faults(), IsEmpty());
  }
  auto connect(Value::Dictionary entitlements) {
    auto client = world.services.connect(kServiceName, {std::move(entitlements), 1234});
    world.queues.run();
    return client;
  }
  static Value::Dictionary entitled() { return {{kRequiredEntitlement, true}}; }

  SimulatedPlatform world;
  StartUp startUp{world.platform};
};

TEST_F(TheService, StandsOnTheRegisteredDefaults) {
  EXPECT_EQ(world.log.texts().front(), "launched");
  const std::pair<const char*, Value> defaults[] = {
      {"CachedWarrantyValidityDuration", 86400},
      {"HighServerVersion", 3},
      {"LowServerVersion", 2},
      {"OneDayInterval", 86400},
      {"PostUpgradeOutreachDelay", 3600},
      {"ServerVersionURL", "https://assets.tarsil.example/library/TARSIL/asset/kvrV2.plist"},
      {"WarrantyURL", "https://coverage.tarsil.example/api/v3/coverage/summary"},
      {"WearablesWarrantyURL", "https://coverage.tarsil.example/api/v2/coverage/summary"},
  };
  EXPECT_EQ(world.preferences.allKeys().size(), std::size(defaults));
  for (const auto& [key, value] : defaults) {
    EXPECT_EQ(world.preferences.objectForKey(key), value) << key;
    world.preferences.setObject(7, key);
    EXPECT_EQ(world.preferences.objectForKey(key), Value(7)) << key;
    world.preferences.removeObject(key);
    EXPECT_EQ(world.preferences.objectForKey(key), value) << key;
  }
}

TEST_F(TheService, AdmitsATrueNumberUnderTheEntitlementAndNothingElse) {
  const std::pair<Value, bool> cases[] = {
      {true, true}, {1, true},      {2.5, true},      {"true", false},          {"1", false},     {0, false},
      {0.0, false}, {false, false}, {Value(), false}, {Value::Array{1}, false}, {Date{1}, false},
  };
  for (const auto& [value, admitted] : cases) {
    world.log.clear();
    const auto client = connect({{kRequiredEntitlement, value}});
    EXPECT_EQ(client->isAccepted(), admitted) << describe(value);
    EXPECT_EQ(client->isRefused(), !admitted) << describe(value);
    EXPECT_EQ(world.log.count(
                  "Rejecting connection to kvragent: missing entitlement 'com.tarsil.private.kvragent'"),
              admitted ? 0U : 1U);
  }
  EXPECT_TRUE(connect({})->isRefused());
}

TEST_F(TheService, KnowsItsCallersBundleWhereThereIsOne) {
  const auto fallback = "callingProcessBundleID is nil. Falling back to Preferences Bundle ID";
  connect(entitled());
  EXPECT_TRUE(world.log.contains("connection added from 1234 with calling process: (null)"));
  EXPECT_TRUE(world.log.contains(fallback));

  world.log.clear();
  world.processes.add(1234, "/Applications/Settings.app/settings",
                      {"/Applications/Settings.app", "com.example.app"});
  connect(entitled());
  EXPECT_TRUE(world.log.contains("connection added from 1234 with calling process: com.example.app"));
  EXPECT_FALSE(world.log.contains(fallback));

  for (const auto& path : {std::string("/bad\xff/x"), std::string(5000, 'x')}) {
    world.log.clear();
    world.processes.add(1234, path, {"/b", "com.example.app"});
    connect(entitled());
    EXPECT_TRUE(world.log.contains("with calling process: (null)"));
  }
}

TEST_F(TheService, GivesEveryConnectionAnAgentThatGoesWithIt) {
  const auto first = connect(entitled());
  const auto second = connect(entitled());
  EXPECT_NE(first->exportedObject(), second->exportedObject());
  const std::weak_ptr<ServiceObject> agent = first->exportedObject();
  first->disconnect();
  world.queues.run();
  EXPECT_TRUE(agent.expired());
  EXPECT_FALSE(second->exportedObject() == nullptr);
}

TEST_F(TheService, ServesEachMemberWithTheOperationBehindIt) {
  world.deviceProperties.answers = {{"SerialNumber", "LOCAL"}};
  const Value device = Value::Dictionary{
      {"serialNumber", "LOCAL"}, {"deviceType", 0}, {"activationDate", world.clock.now()}};
  const Value unknown = Value::Dictionary{{"name", "<unknown>"}, {"serialNumber", "X"}, {"deviceType", 2}};
  const auto info = [](const Value& it) { return Value(Value::Dictionary{{"device", it}}); };
  struct Case {
    const char* member;
    Value::Array arguments;
    Value reply;
  };
  const Case cases[] = {
      {"ScheduleOutreach", {}, true},
      {"ScheduleOutreachAfter", {5.0}, true},
      {"TarsilAccountAdded", {}, true},
      {"CheckIsAvailableInStore", {"b"}, {}},
      {"AppSupportAvailability", {"b"}, {}},
      {"ReadWebURLOverride", {}, {}},
      {"DefaultDevice", {}, device},
      {"PairedDevices", {}, Value::Array{}},
      {"GetDefaultDeviceInfoUsingPolicy", {1}, info(device)},
      {"GetDeviceInfoForSerialNumber", {"X", 0xFFFFFFFFFFFFFFFF}, info(unknown)},
      {"GetAllDeviceInfosUsingPolicy", {1, false}, Value::Array{info(device)}},
      {"DismissFollowUpForSerialNumber", {"X"}, true},
  };
  const auto client = connect(entitled());
  const auto& methods = client->exportedInterface()->methods;
  ASSERT_EQ(methods.size(), std::size(cases));
  for (std::size_t i = 0; i < methods.size(); ++i) {
    EXPECT_STREQ(methods[i].member, cases[i].member);
    EXPECT_EQ(methods[i].in.size(), cases[i].arguments.size());
    const auto call = client->invoke(cases[i].member, cases[i].arguments);
    world.queues.run();
    EXPECT_EQ(call->reply, cases[i].reply) << cases[i].member;
  }
  EXPECT_TRUE(world.log.contains("getting warranty using policy X: 18446744073709551615"));
}

}  // namespace
}  // namespace kvr
