#include "integration/support/BusFixture.h"
#include "platform/local/PeerIdentity.h"
#include "platform/local/bus/BusCodec.h"

#include <gmock/gmock.h>

#include <atomic>
#include <numeric>

namespace kvr::testing {
namespace {

using ::testing::ElementsAre;

using AService = BusFixture;

TEST_F(AService, DeliversTheCallsOfAConnectionInTheirOrderFromTheVeryFirst) {
  constexpr std::uint64_t kCalls = 200;
  std::vector<std::uint64_t> served;
  newBehaviour = [&] {
    return [&](const std::string&, const Value::Array& arguments, const ServiceReply& reply) {
      served.push_back(static_cast<std::uint64_t>(arguments.at(0).asInteger()));
      reply(arguments.at(0));
    };
  };
  const auto serving = serve();
  const RawBusClient client = newClient();
  for (std::uint64_t i = 1; i < kCalls; ++i) {
    ASSERT_GE(sd_bus_send(client.bus(), client.newCall("EchoNumber", "t", {i}).get(), nullptr), 0);
  }
  EXPECT_EQ(client.value("t", client.call("EchoNumber", "t", {kCalls})), Value(kCalls));
  std::vector<std::uint64_t> expected(kCalls);
  std::iota(expected.begin(), expected.end(), 1U);
  EXPECT_EQ(served, expected);
  EXPECT_EQ(decisions.size(), 1U);
}

TEST_F(AService, GivesEveryConnectionAnObjectOfItsOwnThatMayBlockThatConnectionOnly) {
  std::promise<void> release;
  const std::shared_future<void> released = release.get_future().share();
  std::promise<void> entered;
  std::atomic<int> objects = 0;
  newBehaviour = [&] {
    const int number = ++objects;
    return [&, number](const std::string& member, const Value::Array&, const ServiceReply& reply) {
      if (member == "EchoFlag") {
        entered.set_value();
        released.wait();
      }
      reply(Value(number));
    };
  };
  const auto serving = serve();
  const RawBusClient first = newClient();
  const RawBusClient second = newClient();
  EXPECT_EQ(first.value("t", first.call("EchoNumber", "t", {0})), Value(1));
  ASSERT_GE(sd_bus_send(first.bus(), first.newCall("EchoFlag", "b", {true}).get(), nullptr), 0);
  ASSERT_GE(sd_bus_flush(first.bus()), 0);
  entered.get_future().wait();
  EXPECT_EQ(second.value("t", second.call("EchoNumber", "t", {0})), Value(2));
  release.set_value();
}

TEST_F(AService, LetsGoOfTheObjectWithItsConnectionEvenInTheMiddleOfACall) {
  std::promise<ServiceReply> begun;
  newBehaviour = [&] {
    return
        [&](const std::string&, const Value::Array&, const ServiceReply& reply) { begun.set_value(reply); };
  };
  std::promise<void> gone;
  onObjectGone = [&] { gone.set_value(); };
  const auto serving = serve();
  RawBusClient client = newClient();
  ASSERT_GE(sd_bus_send(client.bus(), client.newCall("EchoText", "s", {"x"}).get(), nullptr), 0);
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
  const ServiceReply late = begun.get_future().get();
  EXPECT_EQ(listeners->openCalls(), 1U);

  client.leave();
  ASSERT_EQ(gone.get_future().wait_for(kLimit), std::future_status::ready);
  EXPECT_EQ(listeners->openCalls(), 0U);
  late(Value("too late"));

  newBehaviour = [] {
    return [](const std::string&, const Value::Array&, const ServiceReply& reply) { reply(Value("served")); };
  };
  onObjectGone = [] {};
  const RawBusClient other = newClient();
  EXPECT_EQ(other.value("s", other.call("EchoText", "s", {"x"})), Value("served"));
  EXPECT_THAT(log.errorsWith(""), ElementsAre());
}

TEST_F(AService, AnswersWithAnErrorWhatItCannotServe) {
  std::atomic<int> served = 0;
  newBehaviour = [&] {
    return [&](const std::string&, const Value::Array& arguments, const ServiceReply& reply) {
      ++served;
      if (arguments.at(0) == Value("throw")) throw std::runtime_error("a fault");
      if (arguments.at(0) == Value("kind")) return reply(Value(7));
      if (arguments.at(0) == Value("text")) return reply(Value(std::string("a\0b", 3)));
      if (arguments.at(0) == Value("large")) return reply(Value(std::string(kMaximumBusValueSize + 1, 'x')));
    };
  };
  const auto serving = serve();
  const RawBusClient client = newClient();
  const std::string failed = "org.freedesktop.DBus.Error.Failed";
  const std::string invalid = "org.freedesktop.DBus.Error.InvalidArgs";
  for (const char* fault : {"dropped", "throw", "kind", "text", "large"}) {
    EXPECT_EQ(client.call("EchoText", "s", {fault}).error, failed) << fault;
  }
  EXPECT_EQ(served, 5);
  EXPECT_EQ(client.call("EchoText", "s", {std::string((1U << 20U) + 1, 'x')}).error, invalid);
  EXPECT_EQ(client.call("EchoText", "t", {1}).error, invalid);
  EXPECT_EQ(client.call("EchoText", "ss", {"a", "b"}).error, invalid);
  EXPECT_EQ(client.call("EchoText").error, invalid);
  EXPECT_EQ(client.call("EchoNothing").error, "org.freedesktop.DBus.Error.UnknownMethod");
  EXPECT_EQ(served, 5);
  EXPECT_EQ(decisions.size(), 1U);
}

TEST_F(AService, TakesTheReplyFromAnyThreadAndSendsNoneThatIsNotExpected) {
  std::vector<std::string> served;
  newBehaviour = [&] {
    return [&](const std::string&, const Value::Array& arguments, ServiceReply reply) {
      served.push_back(arguments.at(0).string());
      std::thread([reply = std::move(reply), value = arguments.at(0)] { reply(value); }).join();
    };
  };
  const auto serving = serve();
  const RawBusClient client = newClient();
  const BusMessageRef unanswered = client.newCall("EchoText", "s", {"unanswered"});
  ASSERT_GE(sd_bus_message_set_expect_reply(unanswered.get(), 0), 0);
  ASSERT_GE(sd_bus_send(client.bus(), unanswered.get(), nullptr), 0);
  EXPECT_EQ(client.value("s", client.call("EchoText", "s", {"answered"})), Value("answered"));
  EXPECT_THAT(served, ElementsAre("unanswered", "answered"));
  sd_bus_message* surplus = nullptr;
  while (sd_bus_process(client.bus(), &surplus) > 0) {
    const BusMessageRef held(surplus);
    EXPECT_TRUE(!surplus || sd_bus_message_is_signal(surplus, nullptr, nullptr));
  }
}

TEST_F(AService, IsLostWithoutItsName) {
  const RawBusClient other = newClient();
  ASSERT_GE(sd_bus_request_name(other.bus(), RawBusClient::kName, 0), 0);
  listener->resume({RawBusClient::kInterface, {}});
  EXPECT_TRUE(waitUntilLost());
  EXPECT_EQ(log.errorsWith("somebody else has it").size(), 1U);
}

TEST_F(AService, EndsByGivingItsNameUpAndAnsweringWhatItHasTaken) {
  std::promise<ServiceReply> begun;
  newBehaviour = [&] {
    return
        [&](const std::string&, const Value::Array&, const ServiceReply& reply) { begun.set_value(reply); };
  };
  const auto serving = serve();
  const RawBusClient client = newClient();
  std::optional<std::string> answer;
  const auto handler = [](sd_bus_message* message, void* userdata, sd_bus_error*) {
    const char* text = "";
    sd_bus_message_read(message, "s", &text);
    *static_cast<std::optional<std::string>*>(userdata) = text;
    return 1;
  };
  ASSERT_GE(sd_bus_call_async(client.bus(), nullptr, client.newCall("EchoText", "s", {"x"}).get(), handler,
                              &answer, 0),
            0);
  ASSERT_GE(sd_bus_flush(client.bus()), 0);
  const ServiceReply reply = begun.get_future().get();
  listeners->beginEnding();
  EXPECT_EQ(newClient().call("EchoText", "s", {"x"}).error, "org.freedesktop.DBus.Error.ServiceUnknown");
  reply(Value("the last"));
  listener.reset();
  listeners.reset();
  while (!answer && sd_bus_wait(client.bus(), std::chrono::microseconds(kLimit).count()) >= 0) {
    while (sd_bus_process(client.bus(), nullptr) > 0) {
    }
  }
  EXPECT_EQ(answer, "the last");
}

TEST(APeer, IsHeldToItsVeryProcess) {
  ChildProcess child({"cat", "/dev/tty"}, {});
  child.wait();
  EXPECT_FALSE(PeerIdentity::of(child.pid()));

  const Result<PeerIdentity> self = PeerIdentity::of(::getpid());
  ASSERT_TRUE(self);
  EXPECT_EQ(self->executable(), FileIdentity::of("/proc/self/exe"));
  EXPECT_TRUE(self->isAlive());
}

}  // namespace
}  // namespace kvr::testing
