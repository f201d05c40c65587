#include "platform/local/PeerIdentity.h"
#include "platform/local/bus/BusCodec.h"
#include "support/BusFixture.h"

#include <gmock/gmock.h>

#include <atomic>
#include <cmath>
#include <limits>
#include <numeric>

namespace kvr::testing {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

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
  serve();
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
  serve();
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
  std::promise<void> gone;
  newBehaviour = [&] {
    return
        [&](const std::string&, const Value::Array&, const ServiceReply& reply) { begun.set_value(reply); };
  };
  onObjectGone = [&] { gone.set_value(); };
  serve();
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

TEST_F(AService, RefusesAConnectionForGoodWhenItsProgramIsNotEntitled) {
  entitle("true");
  serve();
  const RawBusClient client = newClient();
  const auto refused = client.call("EchoText", "s", {"x"});
  EXPECT_EQ(refused.error, "org.freedesktop.DBus.Error.AccessDenied");
  EXPECT_THAT(refused.errorText, HasSubstr(std::string(kEntitlement)));

  entitle(true);
  EXPECT_EQ(client.call("EchoText", "s", {"x"}).error, "org.freedesktop.DBus.Error.AccessDenied");
  const RawBusClient other = newClient();
  EXPECT_EQ(other.value("s", other.call("EchoText", "s", {"x"})), Value("x"));
  EXPECT_THAT(decisions, ElementsAre(Value("true"), Value(true)));
}

TEST_F(AService, OpensItsDescriptionToThoseItRefuses) {
  entitle(false);
  serve();
  const RawBusClient client = newClient();
  for (const auto& [interface, member, text] : {std::tuple{"org.freedesktop.DBus.Peer", "GetMachineId", ""},
                                                {"org.freedesktop.DBus.Introspectable", "Introspect",
                                                 R"(<arg type="t" name="number" direction="in"/>)"}}) {
    sd_bus_message* message = nullptr;
    sd_bus_message_new_method_call(client.bus(), &message, RawBusClient::kName, RawBusClient::kPath,
                                   interface, member);
    const auto reply = client.call(BusMessageRef(message));
    EXPECT_THAT(client.value("s", reply).string(), HasSubstr(text)) << member;
  }
  EXPECT_TRUE(decisions.empty());
}

TEST_F(AService, AnswersWithAnErrorWhatItCannotServe) {
  std::atomic<int> served = 0;
  newBehaviour = [&] {
    return [&](const std::string&, const Value::Array& arguments, const ServiceReply& reply) {
      ++served;
      if (arguments.at(0) == Value("throw")) throw std::runtime_error("a fault");
      if (arguments.at(0) == Value("kind")) return reply(Value(7));
      if (arguments.at(0) == Value("text")) return reply(Value(std::string("a\0b", 3)));
    };
  };
  serve();
  const RawBusClient client = newClient();
  struct {
    const char* member;
    const char* signature;
    Value::Array arguments;
    const char* error;
    bool isServed;
  } const cases[] = {
      {"EchoText", "s", {"dropped"}, "org.freedesktop.DBus.Error.Failed", true},
      {"EchoText", "s", {"throw"}, "org.freedesktop.DBus.Error.Failed", true},
      {"EchoText", "s", {"kind"}, "org.freedesktop.DBus.Error.Failed", true},
      {"EchoText", "s", {"text"}, "org.freedesktop.DBus.Error.Failed", true},
      {"EchoText", "s", {std::string(5000, 'x')}, "org.freedesktop.DBus.Error.InvalidArgs", false},
      {"EchoText", "t", {1}, "org.freedesktop.DBus.Error.InvalidArgs", false},
      {"EchoText", "ss", {"a", "b"}, "org.freedesktop.DBus.Error.InvalidArgs", false},
      {"EchoText", "", {}, "org.freedesktop.DBus.Error.InvalidArgs", false},
      {"EchoNothing", "", {}, "org.freedesktop.DBus.Error.UnknownMethod", false},
  };
  for (const auto& one : cases) {
    const int before = served;
    const std::string name =
        std::string(one.member) + "(" + describe(Value(one.arguments)).substr(0, 20) + ")";
    EXPECT_EQ(client.call(one.member, one.signature, one.arguments).error, one.error) << name;
    EXPECT_EQ(served - before, one.isServed ? 1 : 0) << name;
  }
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
  serve();
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

TEST_F(AService, AnswersTooLargeAReplyWithAnErrorAndServesOn) {
  const Value::Bytes fits(kMaximumBusValueSize - 200);
  const Value::Bytes tooLarge(kMaximumBusValueSize + 1);
  newBehaviour = [&] {
    return [&](const std::string&, const Value::Array& arguments, const ServiceReply& reply) {
      reply(Value::Dictionary{{"data", arguments.at(1) == Value(0) ? fits : tooLarge}});
    };
  };
  serve();
  const RawBusClient client = newClient();
  EXPECT_EQ(client.call("Record", "st", {"", 1}).error, "org.freedesktop.DBus.Error.Failed");
  EXPECT_EQ(client.value("a{sv}", client.call("Record", "st", {"", 0}))["data"], Value(fits));
}

TEST_F(AService, ReportsTheLossOfTheBusOnce) {
  std::promise<void> gone;
  onObjectGone = [&] { gone.set_value(); };
  serve();
  const RawBusClient client = newClient();
  client.call("EchoText", "s", {"x"});
  bus.kill();
  EXPECT_TRUE(waitUntilLost());
  EXPECT_EQ(gone.get_future().wait_for(kLimit), std::future_status::ready);
  EXPECT_EQ(log.errorsWith("cannot serve any more").size(), 1U);
}

TEST_F(AService, IsLostWithoutItsName) {
  const RawBusClient other = newClient();
  ASSERT_GE(sd_bus_request_name(other.bus(), RawBusClient::kName, 0), 0);
  listener->resume({RawBusClient::kInterface, {}});
  EXPECT_TRUE(waitUntilLost());
  EXPECT_EQ(log.errorsWith("somebody else has it").size(), 1U);
}

TEST_F(AService, IsLostWithoutABus) {
  bus.kill();
  listener->resume({RawBusClient::kInterface, {}});
  EXPECT_TRUE(waitUntilLost());
  EXPECT_EQ(log.errorsWith("cannot be reached").size(), 1U);
}

TEST_F(AService, EndsByGivingItsNameUpAndAnsweringWhatItHasTaken) {
  std::promise<ServiceReply> begun;
  newBehaviour = [&] {
    return
        [&](const std::string&, const Value::Array&, const ServiceReply& reply) { begun.set_value(reply); };
  };
  serve();
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

// ---- values

Value nested(int depth, bool inArrays, Value innermost) {
  for (int i = 1; i < depth; ++i) {
    innermost = inArrays ? Value(Value::Array{std::move(innermost)})
                         : Value(Value::Dictionary{{"k", std::move(innermost)}});
  }
  return innermost;
}

std::string everyPlane() {
  std::string text;
  for (unsigned plane = 0; plane <= 16; ++plane) {
    const unsigned point = plane * 0x10000 + 0x1234;
    if (plane == 0) {
      text += "\xE1\x88\xB4";
      continue;
    }
    for (const unsigned shift : {18U, 12U, 6U, 0U}) {
      text += static_cast<char>(shift == 18 ? 0xF0 | point >> 18U : 0x80 | (point >> shift & 0x3FU));
    }
  }
  return text;
}

/// Values by name that a tree may hold, each of which some encoding or other would damage.
Value::Dictionary hardValues() {
  const double infinity = std::numeric_limits<double>::infinity();
  const std::string startOfList = "bplist00 and more";
  return {
      {"true", true},
      {"least integer", std::numeric_limits<std::int64_t>::min()},
      {"greatest integer", std::numeric_limits<std::int64_t>::max()},
      {"greatest unsigned", std::numeric_limits<std::uint64_t>::max()},
      {"one tenth", 0.1},
      {"large", 1e300},
      {"negative zero", -0.0},
      {"not a number", std::nan("")},
      {"infinite", -infinity},
      {"whole real", 3.0},
      {"date", Date{-0.25}},
      {"far date", Date{64092211200.5}},
      {"empty text", ""},
      {"line breaks", "a\r\nb\n\u2028c\t\x7F\x01"},
      {"every plane", everyPlane()},
      {"no characters", "\uFFFE \uFDD0 \U0010FFFF"},
      {"text with NUL", std::string("a\0b", 3)},
      {"empty data", Value::Bytes{}},
      {"data", Value::Bytes{0, 255, 'b'}},
      {"data like a list", Value::Bytes(startOfList.begin(), startOfList.end())},
      {"null", Value()},
      {"empty array", Value::Array{}},
      {"array", Value::Array{1, "two", 3.5, Value::Array{}, Value::Dictionary{}}},
      {"array with null", Value::Array{1, Value(), 3}},
      {"empty dictionary", Value::Dictionary{}},
      {"dictionary", Value::Dictionary{{"", 1}, {"\u00E9", Value::Dictionary{{"deviceType", 1}}}}},
      {"dictionary with NUL in a key", Value::Dictionary{{std::string("a\0b", 3), 1}}},
      {"deep arrays", nested(512, true, 1)},
      {"deep dictionaries", nested(512, false, Date{1})},
  };
}

using AValueOnTheBus = BusFixture;

TEST_F(AValueOnTheBus, ComesBackAsItWasWherever) {
  serve();
  const RawBusClient client = newClient();
  const auto echo = [&](const Value& record) {
    return client.value("a{sv}", client.call("EchoRecord", "a{sv}", {record}));
  };
  for (const auto& [name, value] : hardValues()) {
    const Value property = Value::Dictionary{{"property", value}};
    const Value inRecord = Value::Dictionary{{"record", property}};
    EXPECT_EQ(echo(property), property) << name;
    EXPECT_EQ(echo(inRecord), inRecord) << name;
    if (name.starts_with("deep")) continue;
    const Value inTree = Value::Dictionary{{"record", Value::Dictionary{{"tree", Value::Array{property}}}}};
    EXPECT_EQ(echo(inTree), inTree) << name;
  }
  EXPECT_TRUE(std::signbit(echo(Value::Dictionary{{"zero", -0.0}})["zero"].real()));

  const Value records =
      Value::Array{hardValues(), Value::Dictionary{}, Value::Dictionary{{"record", hardValues()}}};
  EXPECT_EQ(client.value("aa{sv}", client.call("EchoRecords", "aa{sv}", {records})), records);
  for (const std::string& text : {std::string(), everyPlane(), std::string("a\r\nb")}) {
    EXPECT_EQ(client.value("s", client.call("EchoText", "s", {text})), Value(text));
  }
  EXPECT_EQ(client.value("d", client.call("EchoReal", "d", {0.1})), Value(0.1));
}

TEST_F(AValueOnTheBus, MayBeNestedToAnyDepthWithoutBreakingTheConnection) {
  serve();
  const RawBusClient client = newClient();
  for (int depth = 1; depth <= 70; ++depth) {
    for (const bool inArrays : {false, true}) {
      const Value innermost = depth % 2 ? Value(Date{1}) : Value(Value::Bytes{1});
      const Value tree =
          Value::Dictionary{{"warranty", Value::Dictionary{{"tree", nested(depth, inArrays, innermost)}}}};
      const Value records = Value::Array{tree};
      ASSERT_EQ(client.value("aa{sv}", client.call("EchoRecords", "aa{sv}", {records})), records) << depth;
    }
  }
  const Value tooDeep = Value::Dictionary{{"tree", nested(513, true, Value::Array{})}};
  newBehaviour = [&] {
    return [&](const std::string&, const Value::Array&, const ServiceReply& reply) { reply(tooDeep); };
  };
  const RawBusClient other = newClient();
  for (int i = 0; i < 2; ++i) {
    EXPECT_EQ(other.call("Record", "st", {"", 0}).error, "org.freedesktop.DBus.Error.Failed");
  }
}

/// The signature of what stands under a path of keys in a record.
std::string signatureUnder(sd_bus_message* message, const std::vector<std::string>& path) {
  const char* contents = nullptr;
  for (std::size_t i = 0; i < path.size(); ++i) {
    if (i > 0) sd_bus_message_enter_container(message, 'v', "a{sv}");
    sd_bus_message_enter_container(message, 'a', "{sv}");
    const char* key = nullptr;
    while (sd_bus_message_enter_container(message, 'e', "sv") > 0) {
      sd_bus_message_read(message, "s", &key);
      if (key == path[i]) break;
      sd_bus_message_skip(message, "v");
      sd_bus_message_exit_container(message);
    }
  }
  sd_bus_message_peek_type(message, nullptr, &contents);
  return contents ? contents : "";
}

TEST_F(AValueOnTheBus, HasTheTypesThatOtherClientsCountOn) {
  const Value device = Value::Dictionary{
      {"name", "a watch"}, {"serialNumber", "S"}, {"activationDate", Date{1}}, {"deviceType", 1}};
  const Value plain = Value::Dictionary{{"covered", true}, {"n", 1}, {"big", ~std::uint64_t{0}}, {"r", 1.0}};
  const Value unusual = Value::Dictionary{{"covered", Value()}};
  struct {
    Value representation;
    std::vector<std::string> path;
    const char* signature;
  } const cases[] = {
      {plain, {"device"}, "a{sv}"},
      {plain, {"device", "name"}, "s"},
      {plain, {"device", "activationDate"}, "(d)"},
      {plain, {"device", "deviceType"}, "t"},
      {plain, {"warranty"}, "a{sv}"},
      {plain, {"warranty", "DictionaryRepresentation"}, "a{sv}"},
      {plain, {"warranty", "DictionaryRepresentation", "covered"}, "b"},
      {plain, {"warranty", "DictionaryRepresentation", "n"}, "x"},
      {plain, {"warranty", "DictionaryRepresentation", "big"}, "t"},
      {plain, {"warranty", "DictionaryRepresentation", "r"}, "d"},
      {unusual, {"device", "name"}, "s"},
      {unusual, {"warranty"}, "a{sv}"},
      {unusual, {"warranty", "DictionaryRepresentation"}, "ay"},
  };
  serve();
  const RawBusClient client = newClient();
  for (const auto& one : cases) {
    const Value info =
        Value::Dictionary{{"device", device},
                          {"warranty", Value::Dictionary{{"DictionaryRepresentation", one.representation}}}};
    const auto reply = client.call("EchoRecord", "a{sv}", {info});
    ASSERT_TRUE(reply.message) << reply.errorText;
    EXPECT_EQ(signatureUnder(reply.message.get(), one.path), one.signature) << one.path.back();
  }
}

TEST_F(AValueOnTheBus, ReadsAsNullWhereItsKindIsUnknown) {
  serve();
  const RawBusClient client = newClient();
  const BusMessageRef call = client.newCall("EchoRecord");
  ASSERT_GE(sd_bus_message_append(call.get(), "a{sv}", 6, "small", "y", 7, "path", "o", "/a", "list", "as", 1,
                                  "x", "struct", "(si)", "x", 1, "variant", "v", "s", "x", "last", "s", "x"),
            0);
  EXPECT_EQ(client.value("a{sv}", client.call(call)), Value(Value::Dictionary{{"small", 7},
                                                                              {"path", "/a"},
                                                                              {"list", Value()},
                                                                              {"struct", Value()},
                                                                              {"variant", Value()},
                                                                              {"last", "x"}}));
}

}  // namespace
}  // namespace kvr::testing
