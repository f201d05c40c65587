#include "integration/support/BusFixture.h"

#include <cmath>
#include <limits>
#include <string>
#include <vector>

namespace kvr::testing {
namespace {

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
  const auto serving = serve();
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
  const auto serving = serve();
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
