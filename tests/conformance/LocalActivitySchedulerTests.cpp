#include "conformance/FileWorld.h"
#include "local/device/LocalCarrierInfo.h"
#include "local/loop/EventLoop.h"
#include "local/loop/LocalWorkQueues.h"
#include "local/process/LocalActivityScheduler.h"
#include "local/system/LocalClock.h"
#include "local/system/LocalRandom.h"
#include "simulated/SimulatedDeviceProperties.h"

#include <mutex>

namespace kvr {
namespace {

constexpr const char* kUpgrade = "com.tarsil.kvragent.upgrade";
constexpr const char* kBoot = "com.tarsil.kvragent.boot";

/// One run of the process, on a device that outlives it. The test's thread is the main thread.
struct Start {
  Start(FileWorld& world, DeviceProperties& properties, const Clock& clock)
      : device(world.path("device")),
        lists(world.files(), world.clock, world.log),
        root(lists, world.log, device),
        queues(loop, world.log),
        scheduler(loop, root, clock, queues, random, properties, world.log, "com.tarsil.kvragent",
                  {kUpgrade, kBoot}, {device + "/boot_id", device + "/netif"}) {}
  ~Start() {
    scheduler.beginEnding();
    queues.beginEnding();
    queues.drain(30);
  }

  ActivityBlock recorder(const std::string& name) {
    return [this, name](const ActivityHandler& handler) {
      const std::lock_guard lock(mutex);
      runs.push_back(name);
      handler(ActivityResult::Finished);
      loop.exit(0);
    };
  }
  void add(const std::string& identifier, const ActivityCriteria& criteria) {
    scheduler.newActivity(identifier)->registerAnew({.criteria = criteria}, recorder(identifier));
  }
  void monitor(const std::string& identifier) {
    scheduler.newActivity(identifier)->checkIn({}, recorder(identifier));
  }
  /// Ends this run in an orderly way; returns the activities that have run in it.
  std::vector<std::string> finish() {
    queues.drain(30);
    return runs;
  }

  const std::string device;
  EventLoop loop;
  PropertyListFiles lists;
  DeviceRoot root;
  LocalRandom random;
  LocalWorkQueues queues;
  std::mutex mutex;
  std::vector<std::string> runs;
  LocalActivityScheduler scheduler;
};

struct ALocalScheduler : ::testing::Test {
  ALocalScheduler() { writeFile(device + "/boot_id", "one\n"); }
  std::unique_ptr<Start> start() { return std::make_unique<Start>(world, properties, world.clock); }
  Value stored() { return world.tree(path); }

  FileWorld world{true};
  const std::string device = world.path("device");
  const std::string path = world.path("Library/Activities/com.tarsil.kvragent.plist");
  SimulatedDeviceProperties properties;
};

TEST_F(ALocalScheduler, TakesARegistrationUpAgainAndRunsItOnce) {
  start()->add("a", {3600, 360});
  const auto before = stored()["activities"]["a"];
  EXPECT_GE(before["dueDate"].date(), world.clock.now() + 3600);
  EXPECT_LE(before["dueDate"].date(), world.clock.now() + 3960);
  const auto monitored = [&](bool isDue) {
    const auto local = start();
    local->monitor("a");
    if (isDue) local->loop.run();
    return local->finish();
  };
  EXPECT_THAT(monitored(false), IsEmpty());
  EXPECT_EQ(stored()["activities"]["a"], before) << "nothing is drawn anew";
  world.clock.moveBy(3960);
  EXPECT_THAT(monitored(true), ElementsAre("a"));
  EXPECT_TRUE(stored()["activities"]["a"].isNull());
}

TEST_F(ALocalScheduler, RunsWhatBecomesDueByItsTimer) {
  const LocalClock clock;
  Start local(world, properties, clock);
  local.add("a", {1, 0});
  local.loop.run();
  EXPECT_THAT(local.finish(), ElementsAre("a"));
}

TEST_F(ALocalScheduler, WaitsForTheNetworkWithoutAskingAgain) {
  const auto setNetwork = [&](bool isReachable) {
    world.putTree(device + "/Network.plist", Dictionary{{"reachable", isReachable}});
  };
  // The network returns because "Network.plist" says so, because it is deleted, or because the host's service
  // says so.
  const std::pair<std::function<void()>, std::function<void()>> cases[] = {
      {[&] { setNetwork(false); }, [&] { setNetwork(true); }},
      {[&] { setNetwork(false); }, [&] { std::filesystem::remove_all(device); }},
      {[&] { world.put(device + "/netif", "# networkd\nCARRIER_STATE=no-carrier\nOPER_STATE=no-carrier\n"); },
       [&] { world.put(device + "/netif", "OPER_STATE=routable\n"); }}};
  for (const auto& [lose, regain] : cases) {
    lose();
    const auto local = start();
    local->add("a", {0, 0, true});
    EXPECT_EQ(local->scheduler.runsUnderWay(), 0U);
    regain();
    local->loop.run();
    EXPECT_THAT(local->finish(), ElementsAre("a"));
  }
}

TEST_F(ALocalScheduler, RunsOccasionsAfterUpgradeBootAndDamage) {
  const auto runsOfAStart = [this] {
    const auto local = start();
    local->scheduler.suspend();
    local->monitor(kUpgrade);
    local->monitor(kBoot);
    EXPECT_EQ(local->scheduler.runsUnderWay(), 0U);
    local->scheduler.resume();
    return local->finish();
  };
  properties.answers["ProductVersion"] = "17.1";
  EXPECT_THAT(runsOfAStart(), ElementsAre(kUpgrade));
  EXPECT_THAT(runsOfAStart(), IsEmpty());
  writeFile(device + "/boot_id", "two\n");
  EXPECT_THAT(runsOfAStart(), ElementsAre(kBoot));
  writeFile(device + "/boot_id", "three\n");
  properties.answers["ProductVersion"] = "17.2";
  EXPECT_THAT(runsOfAStart(), ElementsAre(kBoot, kUpgrade));
  properties.answers.erase("ProductVersion");
  EXPECT_THAT(runsOfAStart(), IsEmpty());
  properties.answers["ProductVersion"] = "17.2";
  EXPECT_THAT(runsOfAStart(), IsEmpty());
  EXPECT_THAT(world.errors(), IsEmpty());
  world.put(path, "damaged");
  EXPECT_THAT(runsOfAStart(), ElementsAre(kUpgrade)) << "the boot is only recorded";
  EXPECT_THAT(world.errors(), SizeIs(1));
  EXPECT_EQ(stored()["bootIdentifier"], Value("three"));
}

TEST(LocalCarriers, AreNamedByTheirIndex) {
  FileWorld world(true);
  const DeviceRoot root(world.lists, world.log, world.path("device"));
  const LocalCarrierInfo carriers(root);
  EXPECT_THAT(carriers.subscriptions(), IsEmpty());
  const Value list = Array{Dictionary{{"mobileCountryCode", "001"}, {"mobileNetworkCode", "01"}}, 7,
                           Dictionary{{"mobileNetworkCode", 5}}};
  world.putTree(root.pathOf("Carriers.plist"), list);
  const auto subscriptions = carriers.subscriptions();
  ASSERT_THAT(subscriptions, SizeIs(2));
  EXPECT_EQ(describe(subscriptions.at("0")), "001/01");
  EXPECT_EQ(describe(subscriptions.at("2")), "(null)/(null)");
}

}  // namespace
}  // namespace kvr
