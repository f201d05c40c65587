#include "integration/support/BusFixture.h"
#include "unit/platform/Trees.h"

#include <cmath>

namespace kvr::testing {
namespace {

Value nested(int depth, bool inArrays, Value innermost) {
  for (int i = 1; i < depth; ++i) {
    innermost = inArrays ? Value(Value::Array{std::move(innermost)})
                         : Value(Value::Dictionary{{"k", std::move(innermost)}});
  }
  return innermost;
}

using AValueOnTheBus = BusFixture;

TEST_F(AValueOnTheBus, ComesBackAsItWasWherever) {
  const std::string startOfList = "bplist00 and more";
  Value::Dictionary hard = {
      {"not a number", std::nan("")},
      {"infinite", -std::numeric_limits<double>::infinity()},
      {"dates", Value::Array{Date{-0.25}, Date{64092211200.5}}},
      {"no characters", "\uFFFE \uFDD0 \U0010FFFF\x7F\x01"},
      {"NUL", std::string("a\0b", 3)},
      {"data", Value::Array{Value::Bytes{}, Value::Bytes{0, 255, 'b'}}},
      {"data like a list", Value::Bytes(startOfList.begin(), startOfList.end())},
      {"null", Value()},
      {"array with null", Value::Array{1, Value(), 3}},
      {"dictionary with NUL in a key", Value::Dictionary{{std::string("a\0b", 3), 1}}},
      {"deep arrays", nested(512, true, 1)},
      {"deep dictionaries", nested(512, false, Date{1})},
  };
  const Value others = treeForEveryEncoding();
  hard.insert(others.dictionary().begin(), others.dictionary().end());

  const auto serving = serve();
  const RawBusClient client = newClient();
  const auto echo = [&](const Value& record) {
    return client.value("a{sv}", client.call("EchoRecord", "a{sv}", {record}));
  };
  for (const auto& [name, value] : hard) {
    const Value property = Value::Dictionary{{"property", value}};
    const Value inRecord = Value::Dictionary{{"record", property}};
    EXPECT_EQ(echo(property), property) << name;
    EXPECT_EQ(echo(inRecord), inRecord) << name;
    if (name.starts_with("deep")) continue;
    const Value inTree = Value::Dictionary{{"record", Value::Dictionary{{"tree", Value::Array{property}}}}};
    EXPECT_EQ(echo(inTree), inTree) << name;
  }
  EXPECT_TRUE(std::signbit(echo(Value::Dictionary{{"zero", -0.0}})["zero"].real()));
  const Value records = Value::Array{hard, Value::Dictionary{}, Value::Dictionary{{"record", hard}}};
  EXPECT_EQ(client.value("aa{sv}", client.call("EchoRecords", "aa{sv}", {records})), records);
  EXPECT_EQ(client.value("s", client.call("EchoText", "s", {"a\r\n\U0001F600"})), Value("a\r\n\U0001F600"));
  EXPECT_EQ(client.value("d", client.call("EchoReal", "d", {0.1})), Value(0.1));
}

TEST_F(AValueOnTheBus, MayBeNestedToAnyDepthWithoutBreakingTheConnection) {
  const auto serving = serve();
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
  const auto serving = serve();
  const RawBusClient client = newClient();
  const auto signatureIn = [&](const Value& representation, const std::vector<std::string>& path) {
    const Value device =
        Value::Dictionary{{"name", "a watch"}, {"activationDate", Date{1}}, {"deviceType", 1}};
    const Value warranty = Value::Dictionary{{"DictionaryRepresentation", representation}};
    const Value info = Value::Dictionary{{"device", device}, {"warranty", warranty}};
    const auto reply = client.call("EchoRecord", "a{sv}", {info});
    return reply.message ? signatureUnder(reply.message.get(), path) : reply.errorText;
  };
  const Value plain = Value::Dictionary{{"covered", true}, {"n", 1}, {"big", ~std::uint64_t{0}}, {"r", 1.0}};
  const std::pair<std::vector<std::string>, const char*> cases[] = {
      {{"device"}, "a{sv}"},
      {{"device", "name"}, "s"},
      {{"device", "activationDate"}, "(d)"},
      {{"device", "deviceType"}, "t"},
      {{"warranty", "DictionaryRepresentation"}, "a{sv}"},
      {{"warranty", "DictionaryRepresentation", "covered"}, "b"},
      {{"warranty", "DictionaryRepresentation", "n"}, "x"},
      {{"warranty", "DictionaryRepresentation", "big"}, "t"},
      {{"warranty", "DictionaryRepresentation", "r"}, "d"},
  };
  for (const auto& [path, signature] : cases) EXPECT_EQ(signatureIn(plain, path), signature) << path.back();
  const Value unusual = Value::Dictionary{{"covered", Value()}};
  EXPECT_EQ(signatureIn(unusual, {"warranty"}), "a{sv}");
  EXPECT_EQ(signatureIn(unusual, {"warranty", "DictionaryRepresentation"}), "ay");
}

TEST_F(AValueOnTheBus, ReadsAsNullWhereItsKindIsUnknown) {
  const auto serving = serve();
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
