// How an agent leaves cleanly, and what stands in for it.
#include "integration/support/AgentWorld.h"
#include "integration/support/BusFixture.h"
#include "integration/support/DatagramSocket.h"
#include "local/http/LocalHTTP.h"
#include "local/process/LocalCleanExit.h"
#include "local/system/LocalRandom.h"
#include "platform/names/Names.h"
#include "simulated/SimulatedDeviceProperties.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <systemd/sd-event.h>

#include <array>
#include <ctime>

namespace kvr::testing {
namespace {

/// The clean exit and the parts that it asks whether they are idle, in this process.
struct ACleanExit : BusFixture {
  ACleanExit() { manageProcess(::getpid()); }
  ~ACleanExit() override {
    ::unsetenv("SYSTEMD_EXEC_PID");
    activities_.beginEnding();
    http_.beginEnding();
    stop();
  }
  /// Lets a service manager have started the process with this number.
  static void manageProcess(pid_t process) {
    ::setenv("SYSTEMD_EXEC_PID", std::to_string(process).c_str(), 1);
  }
  /// Has the main loop do this in half a second, which is several times what an idle agent takes to leave.
  void later(std::function<void()> work) {
    later_ = std::move(work);
    const auto act = [](sd_event_source*, std::uint64_t, void* self) {
      static_cast<ACleanExit*>(self)->later_();
      return 0;
    };
    ASSERT_GE(sd_event_add_time_relative(loop().event(), nullptr, CLOCK_MONOTONIC, 500'000, 0, act, this), 0);
  }
  /// Requests the exit while something is under way; it must come after the end of that.
  void expectExitAfter(const std::function<void()>& end) {
    bool isOver = false;
    exit_.requestWhenIdle();
    later([&] {
      isOver = true;
      end();
    });
    EXPECT_EQ(loop().run(), EXIT_SUCCESS);
    EXPECT_TRUE(isOver);
  }

  const std::shared_ptr<void> serving_ = serve();
  LocalRandom random_;
  SimulatedDeviceProperties properties_;
  LocalHTTP http_{queues(), log};
  LocalActivityScheduler activities_{
      loop(), deviceRoot(), clock(), queues(), random_, properties_, log, "test", {"upgrade", "boot"}, {}};
  LocalCleanExit exit_{loop(), queues(), activities_, http_, *listeners, log, RawBusClient::kName};
  std::function<void()> later_;
};

TEST_F(ACleanExit, WaitsForACall) {
  std::promise<ServiceReply> begun;
  behave([&](const std::string&, const Array&, const ServiceReply& reply) { begun.set_value(reply); });
  const RawBusClient client = newClient();
  client.send("EchoText", "s", {"x"});
  const ServiceReply reply = begun.get_future().get();
  expectExitAfter([&] { reply(Value("served")); });
  EXPECT_EQ(client.value("s", client.next().value()), Value("served"));
}

TEST_F(ACleanExit, WaitsForARequest) {
  const Descriptor server(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t size = sizeof address;
  ASSERT_EQ(::bind(server.get(), reinterpret_cast<sockaddr*>(&address), size), 0);
  ASSERT_EQ(::listen(server.get(), 1), 0);
  ::getsockname(server.get(), reinterpret_cast<sockaddr*>(&address), &size);
  std::atomic<bool> isAnswered{false};
  HTTPRequest request;
  request.url = "http://127.0.0.1:" + std::to_string(ntohs(address.sin_port)) + "/";
  http_.sharedSession().send(request, [&](const HTTPResponse&) { isAnswered = true; });
  expectExitAfter([&] { ::shutdown(server.get(), SHUT_RDWR); });
  EXPECT_TRUE(isAnswered);
}

TEST_F(ACleanExit, WaitsForARunOfAnActivity) {
  std::promise<ActivityHandler> begun;
  activities_.newActivity("test")->registerAnew(
      {}, [&](const ActivityHandler& handler) { begun.set_value(handler); });
  const auto run = begun.get_future().get();
  expectExitAfter([&] { run(ActivityResult::Finished); });
}

TEST_F(ACleanExit, WaitsForWorkOnAQueue) {
  const auto gate = queues().newSignal();
  queues().concurrentQueue(Priority::Background)->async([gate] { gate->wait(std::nullopt); });
  expectExitAfter([&] { gate->signal(); });
}

TEST_F(ACleanExit, WaitsForWorkThatIsDelayed) {
  bool isDone = false;
  queues().after(0.5, queues().mainQueue(), [&] { isDone = true; });
  exit_.requestWhenIdle();
  EXPECT_EQ(loop().run(), EXIT_SUCCESS);
  EXPECT_TRUE(isDone);
}

TEST_F(ACleanExit, IsNoneWhereNothingWouldStartTheNextAgent) {
  manageProcess(::getppid());  // this process has inherited the variable
  exit_.requestWhenIdle();
  later([&] { loop().exit(7); });
  EXPECT_EQ(loop().run(), 7);
  const RawBusClient client = newClient();
  EXPECT_EQ(client.value("s", client.call("EchoText", "s", {"x"})), Value("x"));
}

/// An agent that believes that a service manager has started it, which the test stands for.
struct AManagedAgent : ::testing::Test {
  AManagedAgent() {
    world.moreEnvironment = {{"NOTIFY_SOCKET", (world.directory / "notify").string()}};
    world.prologue = "export SYSTEMD_EXEC_PID=$$";
  }
  /// Expects that the agent leaves for the manager to start the next one, without a waker.
  void expectExit() {
    EXPECT_EQ(manager.receive(), "STOPPING=1");
    EXPECT_EQ(world.agent().wait(), EXIT_SUCCESS);
    const auto client = world.newClient();
    sd_bus_message* reply = nullptr;
    ASSERT_GE(
        sd_bus_call_method(client.bus(), kBusName, kBusPath, kBusName, "ListNames", nullptr, &reply, ""), 0);
    const BusMessageRef held(reply);
    int names = 0;
    sd_bus_message_enter_container(reply, 'a', "s");
    while (sd_bus_message_skip(reply, "s") > 0) ++names;
    EXPECT_EQ(names, 2) << "the bus and this client";
  }

  AgentWorld world;
  const DatagramSocket manager{world.directory / "notify"};
};

TEST_F(AManagedAgent, LeavesToBeStartedAgainWhenTheLanguageChanges) {
  world.startAgent();
  EXPECT_EQ(manager.receive(), "READY=1");
  {
    const auto client = world.newClient();
    sd_bus_emit_signal(client.bus(), names::kNotificationPath, names::kNotificationInterface,
                       names::kNotificationMember, "s", names::kLanguageChanged);
    ASSERT_GE(sd_bus_flush(client.bus()), 0);
  }
  expectExit();
}

struct TheWaker : ::testing::Test {
  /// Starts it in place of an agent that has ended, and waits until it watches.
  std::unique_ptr<ChildProcess> start() const {
    auto waker =
        std::make_unique<ChildProcess>(std::vector<std::string>{"/bin/bash", "-c",
                                                                "set -o pipefail; : | " KVR_PROGRAMS
                                                                "/kvragent-wake | { head -c 1; echo; cat; }"},
                                       world.environment());
    waker->waitForOutput("+");
    return waker;
  }

  AgentWorld world;
};

TEST_F(TheWaker, StartsTheNextAgentAtTheEarliestDateOfAnActivity) {
  const auto due = std::time(nullptr) + 2;
  const auto activity = [due](int later) {
    const Date registered{static_cast<double>(due - 60)};
    return Dictionary{{"delay", 60},
                      {"gracePeriod", 0},
                      {"requiresNetwork", false},
                      {"registeredDate", registered},
                      {"dueDate", Date{static_cast<double>(due + later)}}};
  };
  const Value table = Dictionary{
      {"OSVersion", "17.9"},
      {"activities", Dictionary{{"a", activity(3600)}, {"b", activity(0)}, {"c", activity(7200)}}}};
  writeFile(world.home() / World::kActivities, *writePropertyList(table, PropertyListEncoding::Binary));
  world.letTheBusStartIt();
  const auto waker = start();
  const auto line = world.bus.daemon().waitForErrorOutput("launched");
  std::array<char, 32> text{};
  std::strftime(text.data(), text.size(), "%Y-%m-%dT%H:%M:%S", std::gmtime(&due));
  EXPECT_GE(line, text.data());
  EXPECT_EQ(waker->wait(), EXIT_SUCCESS);
}

TEST_F(TheWaker, PassesOnWhatWasPostedUntilTheNextAgentIsThere) {
  world.bus.addService(RawBusClient::kName, "/bin/true");  // this test takes the name in its place
  const auto waker = start();
  const auto client = world.newClient();
  const auto next = world.newClient();
  std::vector<std::string> posted;
  const auto record = [](sd_bus_message* message, void* list, sd_bus_error*) {
    const char* name = nullptr;
    sd_bus_message_read(message, "s", &name);
    static_cast<std::vector<std::string>*>(list)->emplace_back(name);
    return 0;
  };
  ASSERT_GE(sd_bus_match_signal(next.bus(), nullptr, nullptr, names::kNotificationPath,
                                names::kNotificationInterface, names::kNotificationMember, record, &posted),
            0);
  std::vector<std::string> all{names::kLanguageChanged};
  all.insert(all.end(), 16, names::kDeviceDidPair);
  all.insert(all.end(), {names::kDeviceDidUnpair, names::kLanguageChanged});
  for (const auto& name : all) {
    sd_bus_emit_signal(client.bus(), names::kNotificationPath, names::kNotificationInterface,
                       names::kNotificationMember, "s", name.c_str());
  }
  ASSERT_GE(sd_bus_request_name(client.bus(), RawBusClient::kName, 0), 0);
  EXPECT_EQ(waker->wait(), EXIT_SUCCESS);
  // The answer comes after everything that the waker has sent.
  ASSERT_GE(sd_bus_call_method(next.bus(), kBusName, kBusPath, kBusName, "GetId", nullptr, nullptr, ""), 0);
  while (sd_bus_process(next.bus(), nullptr) > 0) continue;
  const std::vector<std::string> once = all;
  all.insert(all.end(), once.begin(), once.end());
  EXPECT_EQ(posted, all) << "by this test, and then by the waker";
}

}  // namespace
}  // namespace kvr::testing
