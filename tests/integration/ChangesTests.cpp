#include "client/AgentConnection.h"
#include "core/followup/KVRFollowUp.h"
#include "integration/support/AgentWorld.h"
#include "integration/support/BusFixture.h"
#include "platform/codec/JSON.h"
#include "platform/names/Names.h"

#include <poll.h>

namespace kvr::testing {
namespace {

using client::AgentConnection;

std::string textOf(const std::vector<std::string>& records, const std::vector<std::string>& followUps,
                   bool devices) {
  std::string text;
  for (const auto& one : records) text += "record " + one + ", ";
  for (const auto& one : followUps) text += "follow-up " + one + ", ";
  return text + (devices ? "devices" : "");
}

BusMessageRef callOfChanges(const RawBusClient& client, const char* member) {
  sd_bus_message* call = nullptr;
  sd_bus_message_new_method_call(client.bus(), &call, RawBusClient::kName, RawBusClient::kPath,
                                 names::kChangesInterface, member);
  return BusMessageRef(call);
}

/// "true", "false" or the error's name.
std::string ask(const RawBusClient& client, const char* member) {
  const auto reply = client.call(callOfChanges(client, member));
  return reply.message ? (client.value("b", reply).boolean() ? "true" : "false") : reply.error;
}

/// Processes what has come; the next signal of a change, or "" once `isEnough` says so.
std::string nextChange(const RawBusClient& client, const std::function<bool()>& isEnough = {}) {
  const auto texts = [](sd_bus_message* message) {
    std::vector<std::string> found;
    sd_bus_message_enter_container(message, 'a', "s");
    for (const char* text = nullptr; sd_bus_message_read_basic(message, 's', &text) > 0;)
      found.emplace_back(text);
    sd_bus_message_exit_container(message);
    return found;
  };
  while (true) {
    sd_bus_message* message = nullptr;
    const int r = sd_bus_process(client.bus(), &message);
    const BusMessageRef held(message);
    if (message && sd_bus_message_is_signal(message, names::kChangesInterface, "Changed") > 0) {
      const auto records = texts(message);
      const auto followUps = texts(message);
      int devices = 0;
      sd_bus_message_read_basic(message, 'b', &devices);
      return textOf(records, followUps, devices != 0);
    }
    if (r == 0 && isEnough && isEnough()) return "";
    if (r == 0 && !isEnough && sd_bus_wait(client.bus(), 60'000'000) <= 0) return "nothing came";
  }
}

/// What a client has got that will get no more.
std::string rest(const RawBusClient& client) {
  // The bus answers after everything that it has been given before.
  sd_bus_message* id = nullptr;
  sd_bus_call_method(client.bus(), kBusName, kBusPath, kBusName, "GetId", nullptr, &id, "");
  const BusMessageRef held(id);
  return nextChange(client, [] { return true; });
}

struct AnObserver : BusFixture {
  void tell(const Change& change) const { listeners->observers().tell(change); }
  std::shared_ptr<void> serving = serve();
};

TEST_F(AnObserver, IsToldOfAChangeWhileStrangersAndThoseWhoHaveNotAskedAreNot) {
  const RawBusClient observer = newClient();
  const RawBusClient silent = newClient();
  EXPECT_EQ(ask(silent, "Unsubscribe"), "false");
  for (int i = 0; i < 1000; ++i) observer.send(callOfChanges(observer, "Subscribe"));
  EXPECT_EQ(ask(observer, "Subscribe"), "false");
  entitle(false);
  const RawBusClient stranger = newClient();
  EXPECT_EQ(ask(stranger, "Subscribe"), "org.freedesktop.DBus.Error.AccessDenied");
  for (const auto* client : {&silent, &stranger}) {
    sd_bus_add_match(client->bus(), nullptr, "type='signal',interface='com.tarsil.kvragent.Changes'", nullptr,
                     nullptr);
  }

  tell({{"A"}, {"B"}, true});
  EXPECT_EQ(nextChange(observer), "record A, follow-up B, devices");
  for (const auto* client : {&silent, &stranger, &observer}) EXPECT_EQ(rest(*client), "");
  EXPECT_EQ(ask(observer, "Unsubscribe"), "true");
  tell({{"A"}, {}, false});
  EXPECT_EQ(ask(observer, "Unsubscribe"), "false");
  EXPECT_EQ(rest(observer), "");
}

/// Answers to the agent's calls of the numbers around that of a reply, in another's place.
void forgeAnswers(const RawBusClient& client, const RawBusClient::Reply& reply) {
  std::uint64_t last = 0;
  sd_bus_message_get_cookie(reply.message.get(), &last);
  for (std::uint64_t number = last - std::min<std::uint64_t>(last - 1, 4); number < last + 4; ++number) {
    const auto call = client.newCall("EchoText", "s", {"x"});
    sd_bus_message_seal(call.get(), number, 0);
    sd_bus_message* made = nullptr;
    sd_bus_message_new_method_return(call.get(), &made);
    const BusMessageRef answer(made);
    sd_bus_message_set_destination(made, sd_bus_message_get_sender(reply.message.get()));
    sd_bus_send(client.bus(), made, nullptr);
  }
}

TEST_F(AnObserver, GetsAsOneWhatChangedWhileItDidNotRead) {
  const RawBusClient observer = newClient();
  const RawBusClient other = newClient();
  const std::tuple<std::vector<Change>, std::string> floods[] = {
      {{{{"B"}, {}, false}, {{"A"}, {}, false}, {{"A"}, {"C"}, false}}, "record A, record B, follow-up C, "},
      {{{{std::string(5000, 'x')}, {}, false}}, "devices"},
      {{{{std::string("a\0b", 3)}, {}, false}}, "devices"},
      {{{{"\xff"}, {}, false}}, "devices"}};
  EXPECT_EQ(ask(observer, "Subscribe"), "true");
  for (const auto& [flood, expected] : floods) {
    tell({{"first"}, {}, false});
    for (const auto& change : flood) {
      // Once this is answered, what was told before has been handed on.
      forgeAnswers(other, other.call("EchoText", "s", {"x"}));
      other.call("EchoText", "s", {"x"});
      tell(change);
    }
    other.call("EchoText", "s", {"x"});
    EXPECT_EQ(nextChange(observer), "record first, ");
    EXPECT_EQ(nextChange(observer), expected);
    // The ping has come by the first answer, and has been answered by the second one.
    EXPECT_EQ(ask(observer, "Subscribe"), "false");
    EXPECT_EQ(rest(observer), "");
    EXPECT_EQ(ask(observer, "Subscribe"), "false");
  }
}

TEST_F(AnObserver, IsForgottenWhenItLeaves) {
  std::promise<void> gone;
  onObjectGone = [&] { gone.set_value(); };
  RawBusClient observer = newClient();
  EXPECT_EQ(ask(observer, "Subscribe"), "true");
  EXPECT_TRUE(listeners->observers().areThere());
  observer.leave();
  ASSERT_EQ(gone.get_future().wait_for(kLimit), std::future_status::ready);
  EXPECT_FALSE(listeners->observers().areThere());
  EXPECT_THAT(log.texts(LogLevel::Error), IsEmpty());
}

/// A program's loop around a connection, and what its completions said.
struct AProgram {
  std::function<void(const Result<Value>&)> noting(const std::string& name) {
    return [this, name](const Result<Value>& answer) {
      said.push_back(name + " " + (answer ? answer->string() : std::to_string(answer.error().code)));
    };
  }
  AgentConnection::Call call(const std::string& text,
                             AgentConnection::Limit limit = AgentConnection::kNoLimit) {
    return agent->call("EchoText", {{"s", text}}, "s", noting(text), limit);
  }
  void watch() {
    agent->watch([this](const Result<client::Change>& change) {
      said.push_back(!change               ? std::to_string(change.error().code)
                     : change->isBeginning ? "beginning"
                                           : textOf(change->records, change->followUps, change->devices));
    });
  }
  /// False when the bus is lost, and when nothing has come for too long.
  bool turn() {
    constexpr int kLimit = 60'000;  // milliseconds; only a failing test waits this long
    const int wait = agent->milliseconds();
    pollfd one{agent->descriptor(), agent->events(), 0};
    const bool isOwnLimit = wait >= 0 && wait < kLimit;
    if (::poll(&one, 1, isOwnLimit ? wait : kLimit) == 0 && !isOwnLimit) return false;
    return agent->dispatch();
  }
  void turnUntil(std::size_t count) {
    while (said.size() < count && turn()) {
    }
  }

  std::vector<std::string> said;
  std::optional<AgentConnection> agent = *AgentConnection::connect();
};

struct AConnectionOfAProgram : BusFixture {
  AConnectionOfAProgram() {
    behave([this](const std::string&, const Array& arguments, const ServiceReply& reply) {
      const std::lock_guard lock(mutex_);
      if (arguments.at(0).string().starts_with("open")) return held_.push_back(reply);
      reply(arguments.at(0));
    });
    serving = serve();
  }
  ~AConnectionOfAProgram() override {
    for (const auto& reply : std::exchange(held_, {})) reply(Value("late"));
    serving.reset();
  }

  std::shared_ptr<void> serving;

 private:
  std::mutex mutex_;
  std::vector<ServiceReply> held_;
};

TEST_F(AConnectionOfAProgram, CompletesEachCallOnceWhateverBecomesOfIt) {
  const std::string cancelled = " " + std::to_string(client::Cancelled);
  const std::string late = " " + std::to_string(client::NoAnswer);
  using Lines = std::vector<std::string>;
  {
    AProgram program;
    for (const auto* text : {"1", "2", "3"}) program.call(text);
    EXPECT_THAT(program.said, IsEmpty()) << "nothing is completed but by dispatch";
    program.turnUntil(3);
    EXPECT_EQ(program.said, (Lines{"1 1", "2 2", "3 3"}));
  }
  {
    AProgram program;
    const auto open = program.call("open");
    program.call("open late", std::chrono::milliseconds(0));
    program.call("open hour", std::chrono::hours(1));
    EXPECT_TRUE(program.agent->cancel(open));
    EXPECT_FALSE(program.agent->cancel(open));
    program.turnUntil(2);
    EXPECT_EQ(program.said, (Lines{"open" + cancelled, "open late" + late}));
    EXPECT_GT(program.agent->milliseconds(), 0);
    program.call("1");
    program.turnUntil(3);
    program.agent.reset();
    EXPECT_EQ(program.said, (Lines{"open" + cancelled, "open late" + late, "1 1", "open hour" + cancelled}));
  }
  {
    AProgram program;
    program.agent->call("EchoText", {{"s", Value("1")}}, "s",
                        [&](const Result<Value>&) { program.agent.reset(); });
    program.call("open");
    while (program.agent && program.turn()) continue;
    EXPECT_EQ(program.said, Lines{"open" + cancelled}) << "of a connection that a completion destroys";
  }
  AProgram program;
  program.call("open");
  program.call("1");
  program.turnUntil(1);
  bus.kill();
  while (program.turn()) continue;
  program.call("2");
  while (program.turn()) continue;
  EXPECT_EQ(program.said, (Lines{"1 1", "open " + std::to_string(client::AgentUnreachable),
                                 "2 " + std::to_string(client::NoBus)}));
}

TEST_F(AConnectionOfAProgram, BelievesOnlyTheAgentAboutChanges) {
  AProgram program;
  program.watch();
  program.turnUntil(1);
  const RawBusClient forger = newClient();
  for (int i = 0; i < 20; ++i) {
    sd_bus_message* made = nullptr;
    sd_bus_message_new_signal(forger.bus(), &made, RawBusClient::kPath, names::kChangesInterface, "Changed");
    const BusMessageRef signal(made);
    sd_bus_message_append(made, "asasb", 1, "forged", 0, 1);
    sd_bus_message_set_destination(made, (":1." + std::to_string(i)).c_str());
    sd_bus_send(forger.bus(), made, nullptr);
  }
  EXPECT_EQ(rest(forger).substr(0, 6), "record") << "signals go where they are sent";
  listeners->observers().tell({{"A"}, {}, false});
  program.turnUntil(2);
  program.agent->unwatch();
  listeners->observers().tell({{"B"}, {}, false});
  program.call("1");
  program.turnUntil(3);
  EXPECT_EQ(program.said, (std::vector<std::string>{"beginning", "record A, ", "1 1"}));
}

struct TheAgentsObserver : ::testing::Test {
  TheAgentsObserver() {
    ::setenv("DBUS_SESSION_BUS_ADDRESS", world.bus.address().c_str(), 1);
    world.pair({});
  }
  void setLabel(const std::string& label, const std::string& name = "default") const {
    world.setCoverage(name, R"({"covered":true,"coverageLocalizedLabel":")" + label + "\"}");
  }
  void renamePhone(const std::string& name) const {
    world.writeDeviceFile("DeviceProperties.plist",
                          Dictionary{{"SerialNumber", World::kPhone}, {"UserAssignedDeviceName", name}});
  }
  static void refresh(const RawBusClient& client) { World::info(client, World::kPhone, World::Refresh); }

  World world;
};

TEST_F(TheAgentsObserver, IsToldOfEachChangeAndOfNothingElse) {
  const Dictionary item{{"uniqueIdentifier", KVRFollowUp::uniqueIdentfierForSerialNumber(World::kPhone)},
                        {"userInfo", Dictionary{{"FollowupSerialNumber", World::kPhone}}}};
  world.startAgent();
  const RawBusClient observer = world.newClient();
  const RawBusClient other = world.newClient();
  EXPECT_EQ(ask(observer, "Subscribe"), "true");
  const std::string record = "record SNPHONE00001, ";
  const std::tuple<std::string, std::function<void()>> changes[] = {
      {record, [&] { refresh(other); }},
      {"devices",
       [&] {
         refresh(other);
         World::info(other, World::kPhone, World::Default);
         renamePhone("Another");
       }},
      {"follow-up SNPHONE00001, ",
       [&] {
         renamePhone("Another");
         writeFile(world.home() / "Library/FollowUps/com.tarsil.Kavrel.plist",
                   *writePropertyList(Dictionary{{"items", Array{item}}}, PropertyListEncoding::Binary));
         for (int i = 0; i < 2; ++i) other.call("DismissFollowUpForSerialNumber", "s", {World::kPhone});
       }},
      {record,
       [&] {
         setLabel("Warranty", std::string(World::kPhone) + ".fr_FR");
         world.setLocale("fr_FR");
         refresh(other);
       }},
      {"devices", [&] {
         // Not paired yet, or the agent would ask about it and tell what it learns.
         world.writeDeviceFile("PairedDevices.plist",
                               Array{Dictionary{{"serialNumber", World::kFirstWatch}}});
       }}};
  for (const auto& [expected, change] : changes) {
    change();
    EXPECT_EQ(nextChange(observer), expected);
  }
}

TEST_F(TheAgentsObserver, IsToldAgainByTheNextAgent) {
  AProgram program;
  program.watch();
  for (std::size_t agents = 1; agents < 3; ++agents) {
    world.startAgent();
    program.turnUntil(agents);
  }
  renamePhone("Another");
  program.turnUntil(3);
  EXPECT_EQ(program.said, (std::vector<std::string>{"beginning", "beginning", "devices"}));
}

TEST_F(TheAgentsObserver, SeesTheNewStateInEveryProgramThatWatches) {
  world.startAgent();
  const RawBusClient other = world.newClient();
  const std::string programs = KVR_PROGRAMS;
  const std::tuple<std::vector<std::string>, std::string, std::string> watching[] = {
      {{"/example-poll"}, "Old", "New"},
      {{"/example-sd-event"}, "Old", "New"},
      {{"/example-glib"}, "Old", "New"},
      {{"/kvrctl", "status", "--watch"}, "Old", "New"},
      {{"/kvrctl", "monitor"}, "watching", "coverage …0001 changed"}};
  for (auto [command, before, after] : watching) {
    command[0] = programs + command[0];
    if (!std::filesystem::exists(command[0])) continue;  // GLib may be missing
    setLabel("Old");
    refresh(other);
    const Dictionary granted{{"com.tarsil.private.kvragent", true}};
    world.writeDeviceFile("Entitlements.plist", Dictionary{{command[0], granted}});
    const auto from = world.agent().errorOutput().size();
    ChildProcess program(command, world.environment());
    program.waitForOutput(before);
    // From the last of these calls on, it is told.
    world.agent().waitForErrorOutput("connection added", from);
    for (int i = 0; i < 5; ++i) other.call("DefaultDevice");
    setLabel("New");
    refresh(other);
    program.waitForOutput(after);
  }
  ChildProcess unread(
      {"bash", "-c", programs + "/kvrctl monitor | head -n 1; echo ended with ${PIPESTATUS[0]}"},
      world.environment());
  EXPECT_EQ(unread.waitForOutput("ended"), "ended with 1");
}

}  // namespace
}  // namespace kvr::testing
