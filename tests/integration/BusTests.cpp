#include "Trees.h"
#include "integration/support/BusFixture.h"
#include "local/buscodec/BusCodec.h"

#include <sys/resource.h>

#include <atomic>
#include <numeric>
#include <semaphore>

namespace kvr::testing {
namespace {

using AService = BusFixture;
constexpr const char* kLimits = "org.freedesktop.DBus.Error.LimitsExceeded";

TEST_F(AService, DeliversTheCallsOfAConnectionInTheirOrderFromTheVeryFirst) {
  constexpr std::uint64_t kCalls = 200;
  std::vector<std::uint64_t> served;
  int objects = 0;
  newBehaviour = [&] {
    return [&, object = ++objects](const std::string&, const Array& arguments, const ServiceReply& reply) {
      if (object == 1) served.push_back(static_cast<std::uint64_t>(arguments.at(0).asInteger()));
      reply(object == 1 ? arguments.at(0) : Value(object));
    };
  };
  const auto serving = serve();
  const RawBusClient client = newClient();
  for (std::uint64_t i = 1; i < kCalls; ++i) client.send("EchoNumber", "t", {i});
  EXPECT_EQ(client.value("t", client.call("EchoNumber", "t", {kCalls})), Value(kCalls));
  std::vector<std::uint64_t> expected(kCalls);
  std::iota(expected.begin(), expected.end(), 1U);
  EXPECT_EQ(served, expected);
  EXPECT_EQ(decisions.size(), 1U);
  const RawBusClient other = newClient();
  EXPECT_EQ(other.value("t", other.call("EchoNumber", "t", {7})), Value(2)) << "an object of its own";
}

TEST_F(AService, LetsGoOfTheObjectWithItsConnectionEvenInTheMiddleOfACall) {
  std::promise<ServiceReply> begun;
  behave([&](const std::string&, const Array&, const ServiceReply& reply) { begun.set_value(reply); });
  std::promise<void> gone;
  onObjectGone = [&] { gone.set_value(); };
  const auto serving = serve();
  RawBusClient client = newClient();
  client.send("EchoText", "s", {"x"});
  const ServiceReply late = begun.get_future().get();
  EXPECT_EQ(listeners->openCalls(), 1U);

  client.leave();
  ASSERT_EQ(gone.get_future().wait_for(kLimit), std::future_status::ready);
  EXPECT_EQ(listeners->openCalls(), 0U);
  late(Value("too late"));
  EXPECT_THAT(log.texts(LogLevel::Error), IsEmpty());
}

TEST_F(AService, DoesNotCarryOutWhatStillWaitsWhenItsClientLeaves) {
  std::promise<void> begun;
  std::promise<void> release;
  std::vector<Value> served;
  behave([&](const std::string&, const Array& arguments, const ServiceReply& reply) {
    served.push_back(arguments.at(0));
    if (arguments.at(0) == Value("first")) {
      begun.set_value();
      release.get_future().wait();
    }
    reply(arguments.at(0));
  });
  auto serving = serve();
  RawBusClient client = newClient();
  client.send("EchoText", "s", {"first"});
  begun.get_future().wait();
  client.send("EchoText", "s", {"second"});
  const char* unique = nullptr;
  ASSERT_GE(sd_bus_get_unique_name(client.bus(), &unique), 0);
  const std::string name = unique;
  client.leave();
  const RawBusClient other = newClient();
  while (sd_bus_get_name_creds(other.bus(), name.c_str(), 0, nullptr) >= 0) {
  }
  // What the bus tells the service comes before what is sent from now on.
  EXPECT_EQ(other.call("EchoText", "s", {"of another"}).error, "");
  release.set_value();
  serving.reset();
  EXPECT_THAT(served, ElementsAre(Value("first"), Value("of another")));
}

TEST_F(AService, AnswersWithAnErrorWhatItCannotServe) {
  std::atomic<int> served = 0;
  behave([&](const std::string&, const Array& arguments, const ServiceReply& reply) {
    ++served;
    if (arguments.at(0) == Value("throw")) throw std::runtime_error("a fault");
    if (arguments.at(0) == Value("kind")) return reply(Value(7));
    if (arguments.at(0) == Value("text")) return reply(Value(std::string("a\0b", 3)));
    if (arguments.at(0) == Value("large")) return reply(Value(std::string(kMaximumBusValueSize + 1, 'x')));
  });
  const auto serving = serve();
  const RawBusClient client = newClient();
  const std::string failed = "org.freedesktop.DBus.Error.Failed";
  for (const char* fault : {"dropped", "throw", "kind", "text", "large"}) {
    EXPECT_EQ(client.call("EchoText", "s", {fault}).error, failed) << fault;
  }
  EXPECT_EQ(served, 5);
  EXPECT_EQ(decisions.size(), 1U);
}

TEST_F(AService, TakesTheReplyFromAnyThreadAndSendsNoneThatIsNotExpected) {
  std::vector<std::string> served;
  behave([&](const std::string&, const Array& arguments, ServiceReply reply) {
    served.push_back(arguments.at(0).string());
    std::thread([reply = std::move(reply), value = arguments.at(0)] { reply(value); }).join();
  });
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
  EXPECT_THAT(log.texts(LogLevel::Error), Contains(HasSubstr("somebody else has it")).Times(1));
}

TEST_F(AService, EndsByGivingItsNameUpAndAnsweringWhatItHasTaken) {
  std::promise<ServiceReply> begun;
  behave([&](const std::string&, const Array&, const ServiceReply& reply) { begun.set_value(reply); });
  const auto serving = serve();
  const RawBusClient client = newClient();
  client.send("EchoText", "s", {"x"});
  const ServiceReply reply = begun.get_future().get();
  listeners->beginEnding();
  EXPECT_EQ(newClient().call("EchoText", "s", {"x"}).error, "org.freedesktop.DBus.Error.ServiceUnknown");
  reply(Value("the last"));
  listener.reset();
  listeners.reset();
  EXPECT_EQ(client.value("s", client.next().value()), Value("the last"));
}

TEST_F(AService, ServesAsManyConnectionsAsItMayAndAnotherOnceOneHasLeft) {
  constexpr std::size_t kMost = 4096;
  rlimit files{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &files), 0);
  files.rlim_cur = std::max<rlim_t>(files.rlim_cur, std::min<rlim_t>(files.rlim_max, 2 * kMost));
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &files), 0);
  std::counting_semaphore gone{0};
  onObjectGone = [&] { gone.release(); };
  std::vector<RawBusClient> clients;
  while (clients.size() < kMost) {
    clients.push_back(newClient());
    ASSERT_GE(sd_bus_flush(clients.back().bus()), 0);
  }
  const auto serving = serve();
  for (const auto& client : clients) client.send("EchoNumber", "t", {1});
  for (const auto& client : clients) ASSERT_EQ(client.next().value().error, "");
  const RawBusClient another = newClient();
  EXPECT_EQ(another.call("EchoNumber", "t", {1}).error, kLimits);
  clients.back().leave();
  ASSERT_TRUE(gone.try_acquire_for(kLimit));
  EXPECT_EQ(another.call("EchoNumber", "t", {1}).error, "");
}

TEST_F(AService, LeavesLittleToEachConnectionOnceAllTogetherHaveMuchOpen) {
  std::counting_semaphore gone{0};
  onObjectGone = [&] { gone.release(); };
  std::mutex mutex;
  std::vector<ServiceReply> unanswered;
  behave([&](const std::string&, const Array&, const ServiceReply& reply) {
    const std::lock_guard lock(mutex);
    unanswered.push_back(reply);
  });
  const auto serving = serve();
  // How many calls are refused, of so many with this text.
  const auto refused = [](const RawBusClient& client, const std::string& text, int calls) {
    for (int i = 0; i < calls; ++i) client.send("EchoText", "s", {text});
    sd_bus_message* ping = nullptr;
    sd_bus_message_new_method_call(client.bus(), &ping, RawBusClient::kName, RawBusClient::kPath,
                                   "org.freedesktop.DBus.Peer", "Ping");
    client.send(BusMessageRef(ping));
    int count = 0;
    for (auto answer = client.next(); answer && !answer->error.empty(); answer = client.next()) {
      EXPECT_EQ(answer->error, kLimits);
      ++count;
    }
    return count;
  };
  // In total 8192 calls, then 32 MiB.
  const std::tuple<std::string, int, std::string, int> limits[] = {
      {"", 1024, "", 16}, {std::string(1U << 20U, 'x'), 4, std::string(8U << 10U, 'x'), 2}};
  for (const auto& [text, most, little, few] : limits) {
    SCOPED_TRACE(most);
    std::vector<RawBusClient> clients;
    for (int i = 0; i < 10; ++i) clients.push_back(newClient());
    for (std::size_t i = 0; i < 7; ++i) EXPECT_EQ(refused(clients[i], text, most), 0);
    EXPECT_EQ(refused(clients[7], text, most / 2), 0);
    EXPECT_EQ(refused(clients[8], text, most / 2 + 2), 2) << "the total is reached";
    EXPECT_EQ(refused(clients[9], little, few + 2), 2);
    clients[0].leave();
    EXPECT_TRUE(gone.try_acquire_for(kLimit));
    EXPECT_EQ(refused(clients[9], little, 1), 0);
    clients.clear();
    for (int i = 1; i < 10; ++i) EXPECT_TRUE(gone.try_acquire_for(kLimit));
  }
}

Value nested(int depth, bool inArrays, Value tree) {
  for (int i = 1; i < depth; ++i) tree = inArrays ? Value(Array{tree}) : Value(Dictionary{{"k", tree}});
  return tree;
}

struct AValueOnTheBus : BusFixture {
  /// Sends a value to the service and returns the value that it sends back.
  Value echo(const char* member, const char* type, const Value& value) {
    return client.value(type, client.call(member, type, {value}));
  }
  Value echo(const Value& record) { return echo("EchoRecord", "a{sv}", record); }

  const std::shared_ptr<void> serving = serve();
  const RawBusClient client = newClient();
};

TEST_F(AValueOnTheBus, ComesBackAsItWasWherever) {
  const std::string startOfList = "bplist00 and more";
  Dictionary hard = {
      {"not a number", std::nan("")},
      {"infinite", -kInfinity},
      {"dates", Array{Date{-0.25}, Date{64092211200.5}}},
      {"no characters", "\uFFFE \uFDD0 \U0010FFFF\x7F\x01"},
      {"NUL", std::string("a\0b", 3)},
      {"data", Array{Value::Bytes{}, Value::Bytes{0, 255, 'b'}}},
      {"data like a list", Value::Bytes(startOfList.begin(), startOfList.end())},
      {"null", Value()},
      {"array with null", Array{1, Value(), 3}},
      {"dictionary with NUL in a key", Dictionary{{std::string("a\0b", 3), 1}}},
      {"deep arrays", nested(512, true, 1)},
      {"deep dictionaries", nested(512, false, Date{1})},
  };
  const Value others = treeForEveryEncoding();
  hard.insert(others.dictionary().begin(), others.dictionary().end());
  for (const auto& [name, value] : hard) {
    const Value property = Dictionary{{"property", value}};
    const Value inRecord = Dictionary{{"record", property}};
    EXPECT_EQ(echo(property), property) << name;
    EXPECT_EQ(echo(inRecord), inRecord) << name;
    if (name.starts_with("deep")) continue;
    const Value inTree = Dictionary{{"record", Dictionary{{"tree", Array{property}}}}};
    EXPECT_EQ(echo(inTree), inTree) << name;
  }
  EXPECT_TRUE(std::signbit(echo(Dictionary{{"zero", -0.0}})["zero"].real()));
  const Value records = Array{hard, Dictionary{}, Dictionary{{"record", hard}}};
  EXPECT_EQ(echo("EchoRecords", "aa{sv}", records), records);
  EXPECT_EQ(echo("EchoText", "s", "a\r\n\U0001F600"), Value("a\r\n\U0001F600"));
  EXPECT_EQ(echo("EchoReal", "d", 0.1), Value(0.1));
}

TEST_F(AValueOnTheBus, MayBeNestedToAnyDepthWithoutBreakingTheConnection) {
  for (int depth = 1; depth <= 70; ++depth) {
    for (const bool inArrays : {false, true}) {
      const Value innermost = depth % 2 ? Value(Date{1}) : Value(Value::Bytes{1});
      const Value tree = Dictionary{{"warranty", Dictionary{{"tree", nested(depth, inArrays, innermost)}}}};
      const Value records = Array{tree};
      ASSERT_EQ(echo("EchoRecords", "aa{sv}", records), records) << depth;
    }
  }
  const Value tooDeep = Dictionary{{"tree", nested(513, true, Array{})}};
  behave([&](const std::string&, const Array&, const ServiceReply& reply) { reply(tooDeep); });
  const RawBusClient other = newClient();
  for (int i = 0; i < 2; ++i) {
    EXPECT_EQ(other.call("Record", "st", {"", 0}).error, "org.freedesktop.DBus.Error.Failed");
  }
}

/// The type of the value under a path of keys in a record.
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
  const auto signatureIn = [&](const Value& representation, const std::vector<std::string>& path) {
    const Value device = Dictionary{{"name", "a watch"}, {"activationDate", Date{1}}, {"deviceType", 1}};
    const Value warranty = Dictionary{{"DictionaryRepresentation", representation}};
    const Value info = Dictionary{{"device", device}, {"warranty", warranty}};
    const auto reply = client.call("EchoRecord", "a{sv}", {info});
    return reply.message ? signatureUnder(reply.message.get(), path) : reply.errorText;
  };
  const Value plain = Dictionary{{"covered", true}, {"n", 1}, {"big", ~std::uint64_t{0}}, {"r", 1.0}};
  const std::pair<std::vector<std::string>, const char*> cases[] = {
      {{"device"}, "a{sv}"},
      {{"device", "name"}, "s"},
      {{"device", "activationDate"}, "(d)"},
      {{"device", "deviceType"}, "t"},
      {{"warranty", "DictionaryRepresentation"}, "a{sv}"},
      {{"warranty", "DictionaryRepresentation", "covered"}, "b"},
      {{"warranty", "DictionaryRepresentation", "n"}, "x"},
      {{"warranty", "DictionaryRepresentation", "big"}, "t"},
      {{"warranty", "DictionaryRepresentation", "r"}, "d"}};
  for (const auto& [path, signature] : cases) EXPECT_EQ(signatureIn(plain, path), signature) << path.back();
  const Value unusual = Dictionary{{"covered", Value()}};
  EXPECT_EQ(signatureIn(unusual, {"warranty"}), "a{sv}");
  EXPECT_EQ(signatureIn(unusual, {"warranty", "DictionaryRepresentation"}), "ay");
}

TEST_F(AValueOnTheBus, ReadsAsNullWhereItsKindIsUnknown) {
  const BusMessageRef call = client.newCall("EchoRecord");
  ASSERT_GE(sd_bus_message_append(call.get(), "a{sv}", 6, "small", "y", 7, "path", "o", "/a", "list", "as", 1,
                                  "x", "struct", "(si)", "x", 1, "variant", "v", "s", "x", "last", "s", "x"),
            0);
  EXPECT_EQ(client.value("a{sv}", client.call(call)), Value(Dictionary{{"small", 7},
                                                                       {"path", "/a"},
                                                                       {"list", Value()},
                                                                       {"struct", Value()},
                                                                       {"variant", Value()},
                                                                       {"last", "x"}}));
}

}  // namespace
}  // namespace kvr::testing
