#include "core/agent/KVRAgentProtocol.h"
#include "integration/support/AgentWorld.h"

#include <signal.h>
#include <unistd.h>

namespace kvr::testing {
namespace {

namespace fs = std::filesystem;

constexpr uid_t kNobody = 65534;
constexpr const char* kRefusal =
    " org.freedesktop.DBus.Error.AccessDenied: missing entitlement 'com.tarsil.private.kvragent'";

/// How to run a program that calls the agent.
struct Launch {
  std::vector<std::string> command;
  ChildProcess::Environment changes{};
  std::function<void()> beforeItCalls{};  ///< runs when it has connected and waits
};

struct TheAgentsPeer : ::testing::Test {
  TheAgentsPeer() {
    // Let another user reach the bus and the programs. The methods should finish at once.
    fs::permissions(world.bus.directory(), fs::perms(0711));
    fs::permissions(world.directory.path(), fs::perms(0711));
    world.changePreference("PostUpgradeOutreachDelay", 0);
    world.misbehave(R"([{"status":500}])");
    world.startAgent();
  }

  fs::path device() const { return world.directory / "device"; }
  void grant(const fs::path& program, const Value& value = true) const {
    const Value entitlements = Dictionary{{"com.tarsil.private.kvragent", value}};
    world.writeDeviceFile("Entitlements.plist", Dictionary{{program.string(), entitlements}});
  }
  /// A separate program without any entitlement.
  fs::path program(const std::string& name) const {
    const auto path = world.directory / name;
    fs::copy_file(KVR_PROGRAMS "/kvr-peer-probe", path, fs::copy_options::overwrite_existing);
    fs::permissions(path, fs::perms(0755));
    return path;
  }
  fs::path grantedProgram(const Value& value = true) const {
    const auto path = program("granted");
    grant(path, value);
    return path;
  }
  void makeOrdinary() const {
    for (const auto* name : {"granted", "other"}) fs::remove(world.directory / name);
    fs::permissions(device(), fs::perms(0755));
    fs::remove(device() / "Entitlements.plist");
  }

  /// The answers, one line per method.
  std::string answersTo(const Launch& run) const {
    ChildProcess::Environment changes = run.changes;
    changes["DBUS_SESSION_BUS_ADDRESS"] = world.bus.address();
    auto& members = changes["KVR_PROBE_MEMBERS"];
    for (const auto& method : agentServiceInterface().methods) {
      members.append(method.member).append(":");
      for (const auto& argument : method.in) members.append(argument.type);
      members.append(" ");
    }
    if (run.beforeItCalls) changes["KVR_PROBE_WAITS"] = "1";
    ChildProcess probe(run.command, changes);
    if (run.beforeItCalls) {
      probe.waitForOutput("ready");
      run.beforeItCalls();
      probe.send(SIGUSR1);
    }
    const auto& last = agentServiceInterface().methods.back().member;
    probe.waitForOutput(std::string(last) + " ");
    return probe.output();
  }
  /// Checks whether every method serves this caller, and the reason in the log; then resets the device.
  void expect(bool isServed, const std::string& name, const Launch& run, const std::string& reason = "") {
    const auto from = world.agent().errorOutput().size();
    const auto answers = answersTo(run);
    for (const auto& method : agentServiceInterface().methods) {
      const std::string expected = isServed ? " answered: " : kRefusal;
      EXPECT_THAT(answers, HasSubstr(method.member + expected + "\n")) << name;
    }
    if (!reason.empty()) world.agent().waitForErrorOutput(reason, from);
    makeOrdinary();
  }

  AgentWorld world;
};

TEST_F(TheAgentsPeer, IsServedOnlyWhenItIsAGrantedProgramOfTheAgentsUser) {
  const std::pair<bool, std::vector<Value>> values[] = {
      {true, {true, 1, 2.5}},
      {false, {0, 0.0, false, "true", Date{1}, Value::Bytes{1}, Array{true}, Dictionary{{"a", true}}}}};
  for (const auto& [isServed, granted] : values) {
    const auto reason = isServed ? "connection added from" : "Rejecting connection to kvragent: missing";
    for (const auto& value : granted) {
      expect(isServed, "granted " + describe(value), {{grantedProgram(value)}}, reason);
    }
  }
  expect(false, "without a file of entitlements", {{program("granted")}});
  grant(program("other"));
  expect(false, "without an entry", {{program("granted")}});
  grantedProgram();
  expect(false, "a copy of the granted program", {{program("other")}});
  const auto other = world.directory / "other";

  // The program file changes while the program runs.
  const auto expectNoneOnce = [&](const char* name, const std::function<void(const fs::path&)>& change) {
    const auto path = grantedProgram();
    expect(false, name, {{path}, {}, [&] { change(path); }});
  };
  expectNoneOnce("replaced", [&](const fs::path& path) { fs::rename(program("other"), path); });
  expectNoneOnce("deleted", [](const fs::path& path) { fs::remove(path); });
  expectNoneOnce("moved elsewhere", [&](const fs::path& path) { fs::rename(path, other); });
  expect(false, "ended after it had connected", {{grantedProgram()}, {{"KVR_PROBE_LEAVES", "1"}}},
         "Error Domain=process");

  // The program has a second name; the entitlement is granted to one of the two.
  for (const bool isSymbolic : {true, false}) {
    for (const bool isLinkGranted : {true, false}) {
      const auto path = program("granted");
      isSymbolic ? fs::create_symlink(path, other) : fs::create_hard_link(path, other);
      grant(isLinkGranted ? other : path);
      expect(true, isSymbolic ? "a symbolic link" : "a hard link", {{isLinkGranted ? path : other}});
    }
  }
  for (const bool isScriptGranted : {true, false}) {
    const auto interpreter = program("granted");
    const auto script = world.directory.write("script", "#!" + interpreter.string() + "\n");
    fs::permissions(script, fs::perms(0755));
    grant(isScriptGranted ? script : interpreter);
    expect(!isScriptGranted, "a script", {{script}});
  }
  const std::tuple<const char*, int, const char*> writable[] = {
      {"Entitlements.plist", 0666, "can be written by everyone"},
      {"Entitlements.plist", 0660, "can be written by group"},
      {"", 0777, "can be written by everyone"}};
  for (const auto& [file, mode, reason] : writable) {
    const auto path = grantedProgram();
    fs::permissions(device() / file, fs::perms(mode));
    expect(false, reason, {{path}}, reason);
  }
  if (::geteuid() != 0) GTEST_SKIP() << "another user's file, program and process take root to prepare";
  const std::string nobody = std::to_string(kNobody);
  const auto path = grantedProgram();
  EXPECT_EQ(::chown((device() / "Entitlements.plist").c_str(), kNobody, kNobody), 0);
  expect(false, "another user has the grants", {{path}}, "belongs to user");
  expect(false, "run by another user", {{"setpriv", "--reuid", nobody, "--clear-groups", grantedProgram()}},
         "it belongs to another user");
  EXPECT_EQ(::chown(grantedProgram().c_str(), kNobody, kNobody), 0);
  fs::permissions(path, fs::perms(04755));
  expect(false, "set to another user", {{path}}, "it belongs to another user");
}

/// A forged answer to the agent's call of this number: the bus's answer about a client, naming `process`.
BusMessageRef forgedAnswer(const RawBusClient& client, const std::string& agent, std::uint64_t number,
                           pid_t process) {
  const auto call = client.newCall("DefaultDevice");
  EXPECT_GE(sd_bus_message_seal(call.get(), number, 0), 0);
  sd_bus_message* answer = nullptr;
  EXPECT_GE(sd_bus_message_new_method_return(call.get(), &answer), 0);
  sd_bus_message_set_destination(answer, agent.c_str());
  sd_bus_message_append(answer, "a{sv}", 2, "UnixUserID", "u", ::geteuid(), "ProcessID", "u", process);
  return BusMessageRef(answer);
}

TEST_F(TheAgentsPeer, IsNotWhoForgedAnswersOfTheBusSayItIs) {
  ChildProcess granted({grantedProgram().string()}, {{"DBUS_SESSION_BUS_ADDRESS", world.bus.address()},
                                                     {"KVR_PROBE_MEMBERS", " "},
                                                     {"KVR_PROBE_WAITS", "1"}});
  granted.waitForOutput("ready");
  const auto client = world.newClient();
  sd_bus_message* ping = nullptr;
  ASSERT_GE(sd_bus_call_method(client.bus(), RawBusClient::kName, RawBusClient::kPath,
                               "org.freedesktop.DBus.Peer", "Ping", nullptr, &ping, ""),
            0);
  const BusMessageRef pong(ping);
  std::uint64_t number = 0;
  ASSERT_GE(sd_bus_message_get_cookie(ping, &number), 0);
  // They arrive right after the call, before the bus can answer the agent's own question about the caller.
  world.agent().send(SIGSTOP);
  ASSERT_GE(sd_bus_send(client.bus(), client.newCall("DefaultDevice").get(), nullptr), 0);
  for (int next = 1; next <= 16; ++next) {
    const auto forged = forgedAnswer(client, sd_bus_message_get_sender(ping),
                                     number + static_cast<std::uint64_t>(next), granted.pid());
    ASSERT_GE(sd_bus_send(client.bus(), forged.get(), nullptr), 0);
  }
  // Once this call is answered, the bus has forwarded all messages before it.
  ASSERT_GE(sd_bus_call_method(client.bus(), kBusName, kBusPath, kBusName, "GetId", nullptr, nullptr, ""), 0);
  world.agent().send(SIGCONT);
  const auto reply = client.call("DefaultDevice");
  EXPECT_EQ(reply.error, "org.freedesktop.DBus.Error.AccessDenied");
  EXPECT_THAT(world.agent().errorOutput(), Not(HasSubstr("connection added from")));
}

}  // namespace
}  // namespace kvr::testing
