#include "core/agent/AgentKeys.h"
#include "core/agent/KVRAgentProtocol.h"
#include "core/agent/StartUp.h"
#include "platform/names/Names.h"
#include "unit/CoverageWorld.h"

namespace kvr {
namespace {

struct TheService : SimulatedTest {
  auto connect() {
    auto client = world.services.connect(names::kAgent, {{{names::kEntitlement, true}}, 1234});
    world.queues.run();
    return client;
  }

  StartUp startUp{world.platform};
};

TEST_F(TheService, KnowsItsCallersBundleWhereThereIsOne) {
  const auto fallback = "callingProcessBundleID is nil. Falling back to Preferences Bundle ID";
  connect();
  EXPECT_TRUE(world.log.contains("connection added from 1234 with calling process: (null)"));
  EXPECT_TRUE(world.log.contains(fallback));

  world.log.clear();
  world.processes.add(1234, "/Applications/Settings.app/settings",
                      {"/Applications/Settings.app", "com.example.app"});
  connect();
  EXPECT_TRUE(world.log.contains("connection added from 1234 with calling process: com.example.app"));
  EXPECT_FALSE(world.log.contains(fallback));

  for (const auto& path : {std::string("/bad\xff/x"), std::string(5000, 'x')}) {
    world.log.clear();
    world.processes.add(1234, path, {"/b", "com.example.app"});
    connect();
    EXPECT_TRUE(world.log.contains("with calling process: (null)"));
  }
}

TEST_F(TheService, ServesEachMemberWithTheOperationBehindIt) {
  world.deviceProperties.answers = {{"SerialNumber", "LOCAL"}};
  const Value device =
      Dictionary{{"serialNumber", "LOCAL"}, {"deviceType", 0}, {"activationDate", world.clock.now()}};
  const Value unknown = Dictionary{{"name", "<unknown>"}, {"serialNumber", "X"}, {"deviceType", 2}};
  const auto info = [](const Value& it) { return Value(Dictionary{{"device", it}}); };
  const std::tuple<const char*, Array, Value> cases[] = {
      {"ScheduleOutreach", {}, true},
      {"ScheduleOutreachAfter", {5.0}, true},
      {"TarsilAccountAdded", {}, true},
      {"CheckIsAvailableInStore", {"b"}, Dictionary{{"AppAvailabilityType", 0}}},
      {"AppSupportAvailability", {"b"}, Dictionary{{"AppBundleID", "b"}, {"AppAvailabilityType", 0}}},
      {"ReadWebURLOverride", {}, {}},
      {"DefaultDevice", {}, device},
      {"PairedDevices", {}, Array{}},
      {"GetDefaultDeviceInfoUsingPolicy", {1}, info(device)},
      {"GetDeviceInfoForSerialNumber", {"X", 0xFFFFFFFFFFFFFFFF}, info(unknown)},
      {"GetAllDeviceInfosUsingPolicy", {1, false}, Array{info(device)}},
      {"DismissFollowUpForSerialNumber", {"X"}, true}};
  const auto client = connect();
  const auto& methods = client->exportedInterface()->methods;
  ASSERT_EQ(methods.size(), std::size(cases));
  for (std::size_t i = 0; i < methods.size(); ++i) {
    const auto& [member, arguments, reply] = cases[i];
    EXPECT_STREQ(methods[i].member, member);
    EXPECT_EQ(methods[i].in.size(), arguments.size());
    const auto call = client->invoke(member, arguments);
    world.queues.run();
    EXPECT_EQ(call->reply, reply) << member;
  }
  EXPECT_TRUE(world.log.contains("getting warranty using policy X: 18446744073709551615"));
}

}  // namespace
}  // namespace kvr
