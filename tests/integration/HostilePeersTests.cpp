#include "integration/support/AgentWorld.h"

#include <chrono>
#include <fstream>

namespace kvr::testing {
namespace {

constexpr const char* kLimits = "org.freedesktop.DBus.Error.LimitsExceeded";
constexpr const char* kInvalid = "org.freedesktop.DBus.Error.InvalidArgs";
constexpr const char* kUnknown = "org.freedesktop.DBus.Error.UnknownMethod";
constexpr const char* kNoObject = "org.freedesktop.DBus.Error.UnknownObject";

/// The agent with hostile peers: it must always serve a polite one, and its memory and descriptors must not
/// grow.
struct TheAgentAmongHostilePeers : ::testing::Test {
  void begin() {
    world.startAgent();
    polite = std::make_unique<RawBusClient>(world.newClient());
    expectPoliteService("at the beginning");
    descriptors_ = descriptors();
    memory_ = memory();
  }
  void expectPoliteService(const std::string& when) const {
    EXPECT_EQ(polite->value("a{sv}", polite->call("DefaultDevice"))["serialNumber"], Value(World::kPhone))
        << when;
  }
  /// Call once the hostile peers have left. Memory is not checked under a sanitizer, which does not reuse it
  /// at once.
  void expectNothingIsLeft(const std::string& when) {
    expectPoliteService(when);
    EXPECT_LE(descriptors(), descriptors_ + 32) << when;  // some connections to the service stay open
    if (!KVR_SANITIZED) {
      EXPECT_LE(memory(), memory_ + (64 << 10)) << when << ", in KiB";
    }
  }
  std::size_t memory() {
    std::ifstream status("/proc/" + std::to_string(world.agent().pid()) + "/status");
    for (std::string word; status >> word;) {
      if (word == "VmRSS:") return status >> word ? std::stoul(word) : 0;
    }
    return 0;
  }
  std::ptrdiff_t descriptors() {
    const std::filesystem::directory_iterator all("/proc/" + std::to_string(world.agent().pid()) + "/fd");
    return std::distance(all, std::filesystem::directory_iterator());
  }

  /// Reads the answers to `count` calls; returns how many had each error name, "" for none.
  static std::map<std::string, int> answers(const RawBusClient& client, int count) {
    std::map<std::string, int> found;
    for (; count > 0; --count) {
      const auto answer = client.next();
      if (!answer) break;
      ++found[answer->error];
    }
    return found;
  }

  World world;
  std::unique_ptr<RawBusClient> polite;

 private:
  std::ptrdiff_t descriptors_ = 0;
  std::size_t memory_ = 0;
};

TEST_F(TheAgentAmongHostilePeers, AnswersWithAnErrorWhateverIsNoCallOfItsInterface) {
  begin();
  using Fill = std::function<void(sd_bus_message*)>;
  const auto nested = [](char type, int depth) -> Fill {
    return [type, depth](sd_bus_message* call) {
      for (int i = depth; i > 0; --i) {
        const auto inner = std::string(static_cast<std::size_t>(i) - 1, 'a') + "s";
        sd_bus_message_open_container(call, type, type == 'a' ? inner.c_str() : i > 1 ? "v" : "s");
      }
      sd_bus_message_append(call, "s", "x");
      for (int i = 0; i < depth; ++i) sd_bus_message_close_container(call);
    };
  };
  const auto text = [](std::size_t size) -> Fill {
    return [size](sd_bus_message* call) { sd_bus_message_append(call, "s", std::string(size, 'x').c_str()); };
  };
  const Fill bytes = [](sd_bus_message* call) {
    const std::string data(30U << 20U, 'x');
    sd_bus_message_append_array(call, 'y', data.data(), data.size());
  };
  const Fill entries = [](sd_bus_message* call) {
    sd_bus_message_open_container(call, 'a', "{sv}");
    for (int i = 0; i < 200'000; ++i) sd_bus_message_append(call, "{sv}", std::to_string(i).c_str(), "i", i);
    sd_bus_message_close_container(call);
  };
  const Fill descriptor = [](sd_bus_message* call) { sd_bus_message_append(call, "h", 0); };
  const Fill nothing = [](sd_bus_message*) {};
  const RawBusClient client = world.newClient();
  const auto expect = [&](const char* error, const char* path, const char* interface,
                          const std::string& member, const Fill& fill) {
    sd_bus_message* made = nullptr;
    sd_bus_message_new_method_call(client.bus(), &made, RawBusClient::kName, path, interface, member.c_str());
    const BusMessageRef message(made);
    fill(made);
    EXPECT_EQ(client.call(message).error, error)
        << path << " " << interface << "." << member << " " << sd_bus_message_get_signature(made, 1);
  };
  const char* const path = RawBusClient::kPath;
  const char* const own = RawBusClient::kInterface;
  for (const auto& member : {std::string("Nothing"), std::string("defaultDevice"), std::string(255, 'M')}) {
    expect(kUnknown, path, own, member, nothing);
  }
  expect(kUnknown, path, "com.example.Other", "DefaultDevice", nothing);
  expect("org.freedesktop.DBus.Error.UnknownInterface", path, "org.freedesktop.DBus.Properties", "GetAll",
         text(8));
  for (const auto* other : {"/", "/com/tarsil/kvragent/x"}) {
    expect(kNoObject, other, own, "DefaultDevice", nothing);
  }
  expect(kInvalid, path, own, "DefaultDevice", text(1));
  for (const auto& fill : {nothing, text((1U << 20U) + 1), text(10U << 20U), bytes, entries, nested('v', 32),
                           nested('v', 62), nested('v', 64), nested('a', 32)}) {
    expect(kInvalid, path, own, "DismissFollowUpForSerialNumber", fill);
  }
  expect("org.freedesktop.DBus.Error.NotSupported", path, own, "DismissFollowUpForSerialNumber", descriptor);
  expectNothingIsLeft("after calls that are none");
}

TEST_F(TheAgentAmongHostilePeers, BoundsWhatOneConnectionLeavesWaiting) {
  world.writeDeviceFile("Store.plist", Dictionary{{"purchaseDelay", 3600}});
  begin();
  // Each of these waits for the store, some seconds long.
  const std::tuple<std::size_t, int, int> floods[] = {{16, 1500, 1024}, {1U << 20U, 12, 4}};
  for (const auto& [textSize, calls, served] : floods) {
    RawBusClient client = world.newClient();
    for (int i = 0; i < calls; ++i) client.send("AppSupportAvailability", "s", {std::string(textSize, 'x')});
    const auto found = answers(client, calls - served);
    EXPECT_EQ(found, (std::map<std::string, int>{{kLimits, calls - served}})) << textSize;
    expectPoliteService("beside a flood of calls");
    client.leave();
  }
  expectNothingIsLeft("after the floods");
}

TEST_F(TheAgentAmongHostilePeers, TurnsAwayWhoeverDoesNotReadAndServesThemOnceTheyHave) {
  begin();
  RawBusClient client = world.newClient();
  constexpr int kCalls = 3000;
  const auto from = world.agent().errorOutput().size();
  for (int i = 0; i < kCalls; ++i) {
    sd_bus_message* call = nullptr;
    sd_bus_message_new_method_call(client.bus(), &call, RawBusClient::kName, RawBusClient::kPath,
                                   "org.freedesktop.DBus.Introspectable", "Introspect");
    client.send(BusMessageRef(call));
  }
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
  world.agent().waitForErrorOutput("does not read what it is answered", from);
  expectPoliteService("beside one who does not read");
  const auto found = answers(client, kCalls);
  EXPECT_GT(found.at(kLimits), 0);
  EXPECT_GT(found.at(""), 1000);
  std::string error = kLimits;
  for (int tries = 0; error == kLimits && tries < 100; ++tries) error = client.call("DefaultDevice").error;
  EXPECT_EQ(error, "");
  client.leave();
  expectNothingIsLeft("after one who did not read");
}

TEST_F(TheAgentAmongHostilePeers, ServesAThousandConnectionsAtOnceAndLetsGoOfThoseThatLeave) {
  world.misbehave(R"([{"late":0.3}])");
  begin();
  std::vector<RawBusClient> clients;
  for (int i = 0; i < 1000; ++i) clients.push_back(world.newClient());
  for (const auto& client : clients) client.send("DefaultDevice");
  for (const auto& client : clients) EXPECT_EQ(answers(client, 1), (std::map<std::string, int>{{"", 1}}));
  clients.erase(clients.begin() + 50, clients.end());
  for (auto& client : clients) {
    client.send("GetAllDeviceInfosUsingPolicy", "tb", {World::Refresh, true});
    client.leave();
  }
  world.misbehave("[]");
  EXPECT_EQ(World::allInfos(*polite, World::Default).size(), 3U);
  expectNothingIsLeft("after a thousand");
  EXPECT_EQ(world.agent().terminate(), 0);
  EXPECT_THAT(world.agent().errorOutput(), Not(HasSubstr("without an answer")));
}

TEST_F(TheAgentAmongHostilePeers, HandlesTheLastOfAFloodOfNotifications) {
  world.pair({});
  begin();
  const RawBusClient client = world.newClient();
  const auto start = std::chrono::steady_clock::now();
  const auto post = [&client](const char* name) {
    sd_bus_emit_signal(client.bus(), "/com/tarsil/NotificationCenter", "com.tarsil.NotificationCenter",
                       "Posted", "s", name);
  };
  const std::string unheard(1U << 20U, 'x');
  for (int i = 0; i < 20'000; ++i) {
    post("com.tarsil.pairedregistry.device-did-pair");
    post("com.tarsil.language.changed");
    if (i % 500 == 0) post(unheard.c_str());
  }
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
  expectPoliteService("beside a flood of notifications");
  world.pair({World::kFirstWatch});
  post("com.tarsil.pairedregistry.device-did-pair");
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
  world.agent().waitForErrorOutput(std::string(World::kFirstWatch) + " : warranty download attempt");
  const auto seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  const auto* const handled = "-[KVRPairedDevicesMonitor _pairedOrActiveDevicesDidChange:]";
  const auto count = static_cast<double>(countOf(handled, world.agent().errorOutput()));
  EXPECT_LE(count, 16 * (seconds + 1) + 2 * seconds + 1) << "sixteen a second, and two of a flood";
  EXPECT_THAT(world.agent().errorOutput(), HasSubstr("come in a flood, those beyond 16 in a row"));
  expectNothingIsLeft("after a flood of notifications");
}

}  // namespace
}  // namespace kvr::testing
