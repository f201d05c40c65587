#include "agent/KVRAgentProtocol.h"
#include "integration/support/AgentWorld.h"
#include "platform/PropertyList.h"

#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>
#include <functional>

namespace kvr::testing {
namespace {

namespace fs = std::filesystem;

constexpr uid_t kNobody = 65534;
constexpr const char* kRefusal =
    " org.freedesktop.DBus.Error.AccessDenied: missing entitlement 'com.tarsil.private.kvragent'";

/// Who calls: how the device and a program are prepared, and how the program is run then.
struct Launch {
  std::vector<std::string> command;
  ChildProcess::Environment changes;
  std::function<void()> beforeItCalls;  ///< it has connected, and waits
};

class TheAgentsPeer : public ::testing::Test {
 protected:
  struct Kind {
    const char* name;
    bool isServed;
    std::function<Launch()> prepare;
    const char* reason = "";  ///< in the agent's log
    bool needsRoot = false;
  };

  TheAgentsPeer() {
    // Another user can get at the bus and the programs. What a member does is done at once.
    fs::permissions(busDirectory(), fs::perms(0711));
    fs::permissions(world.directory.path(), fs::perms(0711));
    Dictionary preferences = world.preferences().dictionary();
    preferences["PostUpgradeOutreachDelay"] = 0;
    world.directory.write("home/Library/Preferences/com.tarsil.kvragent.plist",
                          *writePropertyList(preferences, PropertyListEncoding::Binary));
    world.misbehave(R"([{"status":500}])");
    world.startAgent();
  }

  fs::path busDirectory() const {
    const auto& address = world.bus.address();
    const auto from = address.find("path=") + 5;
    return fs::path(address.substr(from, address.find(',') - from)).parent_path();
  }
  fs::path device() const { return world.directory / "device"; }
  static void grant(const AgentWorld& world, const fs::path& program, const Value& value = true) {
    world.writeDeviceFile("Entitlements.plist",
                          Dictionary{{program.string(), Dictionary{{"com.tarsil.private.kvragent", value}}}});
  }
  void grant(const fs::path& program, const Value& value = true) const { grant(world, program, value); }
  /// A program of its own, with nothing granted to it yet.
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

  /// One line a member.
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
  void expectAnswers(const Kind& kind) {
    const auto from = world.agent().errorOutput().size();
    const auto answers = answersTo(kind.prepare());
    for (const auto& method : agentServiceInterface().methods) {
      const std::string expected = kind.isServed ? " answered: " : kRefusal;
      EXPECT_THAT(answers, HasSubstr(method.member + expected + "\n")) << kind.name;
    }
    if (*kind.reason != '\0') world.agent().waitForErrorOutput(kind.reason, from);
  }

  AgentWorld world;
};

TEST_F(TheAgentsPeer, IsServedOnlyWhenItIsAGrantedProgramOfTheAgentsUser) {
  const auto valued = [this](const Value& value) {
    return [this, value] { return Launch{{grantedProgram(value).string()}, {}, {}}; };
  };
  const auto writable = [this](const std::string& file, int mode) {
    return [this, file, mode] {
      const Launch run{{grantedProgram().string()}, {}, {}};
      fs::permissions(device() / file, fs::perms(mode));
      return run;
    };
  };
  /// The program changes once it runs.
  const auto changed = [this](const std::function<void(const fs::path&)>& change) {
    return [this, change] {
      const auto path = grantedProgram();
      return Launch{{path.string()}, {}, [change, path] { change(path); }};
    };
  };
  /// Another name of a program; either is granted.
  const auto linked = [this](void (*link)(const fs::path&, const fs::path&), bool isLinkGranted) {
    return [this, link, isLinkGranted] {
      const auto path = program("granted");
      const auto other = world.directory / "other";
      link(path, other);
      grant(isLinkGranted ? other : path);
      return Launch{{(isLinkGranted ? path : other).string()}, {}, {}};
    };
  };
  const auto symbolic = [](const fs::path& path, const fs::path& link) { fs::create_symlink(path, link); };
  const auto hard = [](const fs::path& path, const fs::path& link) { fs::create_hard_link(path, link); };
  const auto script = [this](bool isScriptGranted) {
    return [this, isScriptGranted] {
      const auto interpreter = program("granted");
      const auto path = world.directory.write("script", "#!" + interpreter.string() + "\n");
      fs::permissions(path, fs::perms(0755));
      grant(isScriptGranted ? path : interpreter);
      return Launch{{path.string()}, {}, {}};
    };
  };
  const std::string nobody = std::to_string(kNobody);
  const Kind kinds[] = {
      {"granted true", true, valued(true)},
      {"granted 1", true, valued(1)},
      {"granted 0", false, valued(0)},
      {"granted false", false, valued(false)},
      {"granted a text", false, valued("true")},
      {"granted a date", false, valued(Date{1})},
      {"granted data", false, valued(Value::Bytes{1})},
      {"granted an array", false, valued(Array{true})},
      {"granted a dictionary", false, valued(Dictionary{{"a", true}})},
      {"without an entry", false,
       [&] {
         grant(program("other"));
         return Launch{{program("granted").string()}, {}, {}};
       }},
      {"without a file of entitlements", false,
       [&] {
         return Launch{{program("granted").string()}, {}, {}};
       }},
      {"a copy of the granted program", false,
       [&] {
         grantedProgram();
         return Launch{{program("other").string()}, {}, {}};
       }},
      {"replaced", false, changed([this](const fs::path& path) { fs::rename(program("other"), path); })},
      {"deleted", false, changed([](const fs::path& path) { fs::remove(path); })},
      {"moved elsewhere", false,
       changed([this](const fs::path& path) { fs::rename(path, world.directory / "other"); })},
      {"ended after it had connected", false,
       [&] {
         return Launch{{grantedProgram().string()}, {{"KVR_PROBE_LEAVES", "1"}}, {}};
       },
       "Error Domain=process"},
      {"run through a symbolic link", true, linked(symbolic, false)},
      {"granted through a symbolic link", true, linked(symbolic, true)},
      {"run through a hard link", true, linked(hard, false)},
      {"granted through a hard link", true, linked(hard, true)},
      {"a script of a granted interpreter", true, script(false)},
      {"a granted script", false, script(true)},
      {"everyone may write the grants", false, writable("Entitlements.plist", 0666),
       "can be written by everyone"},
      {"a group may write the grants", false, writable("Entitlements.plist", 0660),
       "can be written by group"},
      {"everyone may write the device root", false, writable("", 0777), "can be written by everyone"},
      {"another user has the grants", false,
       [&] {
         const Launch run{{grantedProgram().string()}, {}, {}};
         EXPECT_EQ(::chown((device() / "Entitlements.plist").c_str(), kNobody, kNobody), 0);
         return run;
       },
       "belongs to user", true},
      {"run by another user", false,
       [&] {
         return Launch{{"setpriv", "--reuid", nobody, "--clear-groups", grantedProgram().string()}, {}, {}};
       },
       "it belongs to another user", true},
      {"set to another user", false,
       [&] {
         const auto path = grantedProgram();
         EXPECT_EQ(::chown(path.c_str(), kNobody, kNobody), 0);
         fs::permissions(path, fs::perms(04755));
         return Launch{{path.string()}, {}, {}};
       },
       "it belongs to another user", true},
  };
  for (const auto& kind : kinds) {
    if (kind.needsRoot && ::geteuid() != 0) {
      std::printf("skipped, for it takes root to prepare: %s\n", kind.name);
      continue;
    }
    makeOrdinary();
    expectAnswers(kind);
  }
}

TEST_F(TheAgentsPeer, KeepsWhatWasDecidedForAsLongAsItIsConnected) {
  for (const bool isServed : {true, false}) {
    world.entitle(isServed);
    const auto client = world.newClient();
    EXPECT_EQ(client.call("DefaultDevice").message != nullptr, isServed);
    world.entitle(!isServed);
    EXPECT_EQ(client.call("DefaultDevice").message != nullptr, isServed);
  }
}

/// Answers to calls that the agent may have made, with each of `numbers`: the bus's answer about a client,
/// which names a process.
std::string forgedAnswers(const std::string& agent, std::uint32_t first, std::uint32_t count, pid_t process) {
  std::string body;
  std::string* out = &body;
  const auto align = [&](std::size_t to) { out->resize((out->size() + to - 1) / to * to); };
  const auto number = [&](std::size_t value) {
    align(4);
    const auto little = static_cast<std::uint32_t>(value);
    out->append(reinterpret_cast<const char*>(&little), 4);
  };
  const auto text = [&](std::string_view value) {
    number(value.size());
    out->append(value).push_back('\0');
  };
  number(0);  // the array's length, once it is known
  for (const auto& [key, value] : {std::pair<const char*, std::size_t>{"UnixUserID", ::geteuid()},
                                   {"ProcessID", static_cast<std::size_t>(process)}}) {
    align(8);
    text(key);
    out->append("\1u", 3);
    number(value);
  }
  const auto length = static_cast<std::uint32_t>(body.size() - 8);
  std::memcpy(body.data(), &length, 4);

  std::string all;
  for (std::uint32_t i = 0; i < count; ++i) {
    std::string message("l\2\1\1", 4);
    out = &message;
    number(body.size());
    number(1000 + i);
    number(0);  // the length of the fields
    out->append("\5\1u", 4);
    number(first + i);
    out->append("\6\1s", 4);
    text(agent);
    align(8);
    out->append(std::string_view("\10\1g\0\5a{sv}\0", 11));
    const auto fields = static_cast<std::uint32_t>(message.size() - 16);
    std::memcpy(message.data() + 12, &fields, 4);
    align(8);
    all += message + body;
  }
  return all;
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
  const std::string forged = forgedAnswers(sd_bus_message_get_sender(ping),
                                           static_cast<std::uint32_t>(number) + 1, 16, granted.pid());
  // The agent finds them behind the call, before the bus has answered what the call makes it ask.
  world.agent().send(SIGSTOP);
  ASSERT_GE(sd_bus_send(client.bus(), client.newCall("DefaultDevice").get(), nullptr), 0);
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
  ASSERT_EQ(::send(sd_bus_get_fd(client.bus()), forged.data(), forged.size(), MSG_NOSIGNAL),
            static_cast<ssize_t>(forged.size()));
  // Once this is answered, the bus has handed everything on.
  ASSERT_GE(sd_bus_call_method(client.bus(), kBusName, kBusPath, kBusName, "GetId", nullptr, nullptr, ""), 0);
  world.agent().send(SIGCONT);
  const auto reply = client.call("DefaultDevice");
  EXPECT_EQ(reply.error, "org.freedesktop.DBus.Error.AccessDenied");
  EXPECT_THAT(world.agent().errorOutput(), Not(HasSubstr("connection added from")));
}

}  // namespace
}  // namespace kvr::testing
