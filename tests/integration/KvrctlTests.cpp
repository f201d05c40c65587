#include "integration/KvrctlFixture.h"
#include "local/bus/BusIntrospection.h"
#include "platform/codec/JSON.h"
#include "platform/text/SHA256Hash.h"
#include "unit/OddSerialNumbers.h"

namespace kvr::testing {
namespace {

Value device(const std::string& name) {
  return Dictionary{
      {"name", name}, {"serialNumber", "C02XY1234"}, {"activationDate", Date{86400}}, {"deviceType", 1}};
}

Value info(const Value& warranty) {
  Dictionary record{{"device", device("a watch")}};
  if (!warranty.isNull()) record["warranty"] = Dictionary{{"DictionaryRepresentation", warranty}};
  return record;
}

TEST_F(Kvrctl, AsksWhatItIsTold) {
  const auto serving = serveAgent();
  setAnswer("GetDeviceInfoForSerialNumber", info(Dictionary{{"covered", true}}));
  setAnswer("GetDefaultDeviceInfoUsingPolicy", info(Value()));
  setAnswer("GetAllDeviceInfosUsingPolicy", Array{info(Value()), info(Dictionary{})});
  for (const auto* member : {"DismissFollowUpForSerialNumber", "ScheduleOutreachAfter"}) {
    setAnswer(member, true);
  }
  setAnswer("TarsilAccountAdded", false);
  setAnswer("DefaultDevice", Dictionary{{"name", 7}, {"deviceType", "x"}});
  setAnswer("PairedDevices", Array{device("a watch")});
  const std::tuple<const char*, const char*, int> cases[] = {
      {"device", "DefaultDevice()", 0},
      {"paired", "PairedDevices()", 0},
      {"", "GetAllDeviceInfosUsingPolicy(1, 0)", 0},
      {"refresh", "GetAllDeviceInfosUsingPolicy(2, 0)", 0},
      {"dismiss …1234", "DismissFollowUpForSerialNumber(C02XY1234)", 0},
      {"schedule-outreach --after 60", "ScheduleOutreachAfter(60)", 0},
      {"account-added", "TarsilAccountAdded()", 2},
      {"support-app b", "AppSupportAvailability(b)", 0},
      {"web-url", "ReadWebURLOverride()", 2},
      {"info", "GetDefaultDeviceInfoUsingPolicy(0)", 2},
      {"info S1 --policy refresh", "GetDeviceInfoForSerialNumber(S1, 2)", 0},
      {"info --all --policy cache", "GetAllDeviceInfosUsingPolicy(1, 0)", 0}};
  for (const auto& [arguments, call, status] : cases) {
    const Outcome outcome = run(wordsOf(arguments));
    EXPECT_EQ(outcome.status, status) << outcome.errors;
    EXPECT_EQ(asked(), call);
    EXPECT_EQ(outcome.errors, "");
  }
}

/// Expects one line on standard error, nothing on standard output, and the given status.
MATCHER_P2(IsFailure, status, line, "") {
  return arg.status == status && arg.output.empty() && arg.errors.find('\n') + 1 == arg.errors.size() &&
         ::testing::Value(arg.errors, line);
}

TEST_F(Kvrctl, TellsWhyItGotNoAnswerAndWhatHelps) {
  EXPECT_THAT(run({"device"}), IsFailure(3, HasSubstr("systemctl --user start kvragent")));
  auto serving = serveAgent();
  entitle(true, "/proc/self/exe");
  EXPECT_THAT(run({"device"}), IsFailure(4, AllOf(HasSubstr(kEntitlement), HasSubstr("Entitlements.plist"),
                                                  HasSubstr(kProgram))));
  entitle(true, kProgram);
  EXPECT_THAT(run({"dismiss", "S1"}), IsFailure(2, HasSubstr("kvrctl paired")));
  for (const auto& misuse : std::vector<std::vector<std::string>>{{"devices"},
                                                                  {"info", "S", "--all"},
                                                                  {"info", "--policy", "7"},
                                                                  {"notify", ""},
                                                                  {"info", "\xFF"}}) {
    EXPECT_EQ(run(misuse).status, 1);
  }
  const auto unanswered = hold("DefaultDevice");
  auto waiting = start({"device"});
  unanswered.wait();
  serving.reset();
  EXPECT_THAT(outcomeOf(waiting), IsFailure(3, HasSubstr("cannot be reached")));
  auto monitor = start({"monitor"});
  monitor.waitForOutput("watching");
  bus.kill();
  EXPECT_EQ(monitor.wait(), 3);
  EXPECT_THAT(monitor.errorOutput(), HasSubstr("the session bus has gone"));
  EXPECT_THAT(run({"device"}), IsFailure(3, HasSubstr("DBUS_SESSION_BUS_ADDRESS")));
}

TEST_F(Kvrctl, WritesOneDocumentWithAVersionWhateverItIsAsked) {
  const auto serving = serveAgent();
  setAnswer("DefaultDevice", device("a phone"));
  setAnswer("DismissFollowUpForSerialNumber", true);
  for (const std::string command :
       {"", "device", "paired", "info", "refresh", "dismiss …1234", "schedule-outreach", "account-added",
        "account-added --no-wait", "support-app b", "web-url", "timeline", "notify n", "follow-ups",
        "activities", "doctor"}) {
    const Outcome outcome = run(wordsOf(command + " --json"));
    const auto document = readJSON(outcome.output);
    ASSERT_TRUE(document) << command << outcome.output << outcome.errors;
    EXPECT_EQ((*document)["version"], Value(1)) << outcome.output;
    EXPECT_EQ(outcome.errors, "");
  }
  auto monitor = start({"monitor", "--json"});
  monitor.waitForOutput("watching");
  run({"notify", "com.example.news"});
  const auto told = readJSON(monitor.waitForOutput("com.example.news"));
  ASSERT_TRUE(told);
  EXPECT_EQ((*told)["event"]["event"], Value("posted"));
  EXPECT_EQ(monitor.terminate(), 0);
}

TEST_F(Kvrctl, TellsOfAnActivityHowItEndedAndWhatItWaitsFor) {
  home.write("Library/Activities/com.tarsil.kvragent.plist",
             "<plist><dict><key>activities</key><dict><key>late</key><dict><key>dueDate</key>"
             "<date>2026-01-01T00:00:00Z</date></dict><key>often</key><dict><key>dueDate</key>"
             "<date>2026-01-01T00:00:00Z</date><key>heldUntilDate</key><date>2999-01-01T00:00:00Z</date>"
             "</dict></dict><key>lastRuns</key><dict>"
             "<key>late</key><dict><key>result</key><string>deferred</string></dict>"
             "<key>over</key><dict><key>result</key><string>finished</string></dict></dict></dict></plist>");
  const auto told = [&] {
    std::vector<std::string> lines;
    const auto document = readJSON(run({"activities", "--json"}).output);
    for (const auto& it : (*document)["activities"].array()) {
      lines.push_back(describe(it["lastResult"]) + ", waits for " + describe(it["waitsFor"]));
    }
    return lines;
  };
  EXPECT_THAT(told(), ElementsAre("deferred, waits for the agent, to start",
                                  "(null), waits for the agent, to start", "finished, waits for (null)"));
  const auto serving = serveAgent();
  EXPECT_THAT(told(), ElementsAre("deferred, waits for its next try",
                                  HasSubstr("waits for the limit of starts, until 2999-01-01"),
                                  "finished, waits for (null)"));
}

TEST_F(Kvrctl, PrintsTextThatCanNeitherCommandATerminalNorBreakAPicture) {
  const auto serving = serveAgent();
  setAnswer("GetDefaultDeviceInfoUsingPolicy",
            info(Dictionary{{"covered", true},
                            {"coverageLocalizedLabel", "\x1B]0;owned\x07 \u009B2J\r\nCovered: no\u202E"}}));
  const Outcome text = run({"info"});
  EXPECT_THAT(text.output,
              HasSubstr("Coverage:      \\u001b]0;owned\\u0007 \\u009b2J\\u000d\\u000aCovered: no\\u202e\n"));
  EXPECT_THAT(text.output,
              AllOf(HasSubstr("…1234"), Not(HasSubstr("C02XY1234")), HasSubstr("1970-01-02 00:00")));
  EXPECT_THAT(run({"info", "--show-serial"}).output, HasSubstr("C02XY1234"));
  EXPECT_THAT(run({"info", "--json"}).output, AllOf(Not(HasSubstr("\u009B")), HasSubstr("\\u009b")));
  setAnswer("GetAllDeviceInfosUsingPolicy", Array{Dictionary{{"device", device("<&\x01\uFFFE")}}});
  EXPECT_THAT(run({"timeline", "--svg", "-"}).output, HasSubstr(">&lt;&amp;\\u0001\uFFFD<"));
}

TEST_F(Kvrctl, TakesAnyTextForASerialNumber) {
  const auto serving = serveAgent();
  const std::string call = "FollowUpForSerialNumber";
  setAnswer("Dismiss" + call, true);
  for (const auto& serialNumber : oddSerialNumbers()) {
    const Value own = Dictionary{{"name", "a watch"}, {"serialNumber", serialNumber}};
    setAnswer("DefaultDevice", own);
    setAnswer("PairedDevices", Array{device("another watch")});
    setAnswer("GetDeviceInfoForSerialNumber", Dictionary{{"device", own}});
    setAnswer("GetAllDeviceInfosUsingPolicy", Array{Dictionary{{"device", own}}});
    home.write("Library/Preferences/com.tarsil.kvragent.plist",
               "{ \"" + sha256Hash(serialNumber) + ".dismissed\" = x; }");
    const auto told = readJSON(run({"--json", "--show-serial"}).output);
    ASSERT_TRUE(told);
    const Value status = (*told)["statuses"].array().at(0);
    EXPECT_EQ(status["device"]["serialNumber"], Value(serialNumber));
    EXPECT_EQ(status["isDismissed"], Value(true)) << "known by the hash that the agent uses";
    if (serialNumber.find('\0') != std::string::npos) continue;  // no command line can contain it
    run({"dismiss", "--", serialNumber});
    EXPECT_EQ(asked(), "Dismiss" + call + describe(Value(Array{serialNumber})));
    EXPECT_EQ(run({"info", "--policy", "cache", "--", serialNumber}).errors, "");
    // The agent knows no warranty, so kvrctl checks whether the device exists.
    EXPECT_EQ(asked(), "PairedDevices()");
  }
}

TEST_F(Kvrctl, WritesOneJSONDocumentOfEverythingTheAgentKnows) {
  const auto serving = serveAgent();
  const Value warranty = Dictionary{{"since", Date{86400.5}},
                                    {"data", Value::Bytes{1, 2, 3}},
                                    {"null", Value()},
                                    {"big", ~std::uint64_t{0}}};
  setAnswer("GetAllDeviceInfosUsingPolicy", Array{info(warranty), info(Value())});
  const std::string told =
      R"({"device":{"name":"a watch","serialNumber":"C02XY1234","deviceType":1,"type":"Watch",)"
      R"("activationDate":"1970-01-02T00:00:00Z"},"warranty":)";
  EXPECT_EQ(
      *readJSON(run({"info", "--all", "--json", "--show-serial"}).output),
      *readJSON(R"({"version":1,"deviceInfos":[)" + told +
                R"({"since":"1970-01-02T00:00:00Z","data":"AQID","null":null,"big":18446744073709551615}},)" +
                told + "null}]}"));
}

TEST_F(Kvrctl, ReadsDatesAsTheAgentDoes) {
  const auto serving = serveAgent();
  const std::pair<Value, Value> cases[] = {{1'700'000'000'999, "2023-11-14T22:13:20Z"},
                                           {10'000'000'000.9, "2286-11-20T17:46:40Z"},
                                           {true, "1970-01-01T00:00:01Z"},
                                           {-1, Value()}};  // beyond any calendar
  for (const auto& [epoch, date] : cases) {
    setAnswer("GetAllDeviceInfosUsingPolicy",
              Array{info(Dictionary{{"covered", true},
                                    {"coverageEndDate", epoch},
                                    {"zubOfferEligibleUntil", epoch},
                                    {"featureToggleParameters", Dictionary{{"zubOfferDisplay", true}}}})});
    const auto document = readJSON(run({"--json"}).output);
    ASSERT_TRUE(document);
    EXPECT_EQ((*document)["statuses"].array().at(0)["coverageEndDate"], date);
    EXPECT_EQ(run({}).status, 0);
    EXPECT_EQ(run({"timeline"}).status, 0);
  }
}

/// What the file declares, without its comments and line breaks.
std::string declarationsIn(std::string text) {
  text.erase(0, text.find("<interface name=\"com.tarsil"));
  for (auto at = text.find("<!--"); at != std::string::npos; at = text.find("<!--")) {
    text.erase(at, text.find("-->", at) + 3 - at);
  }
  std::string line;
  for (const char c : text) {
    const bool isBlank = c == ' ' || c == '\n';
    if (!isBlank || !line.ends_with(' ')) line += isBlank ? ' ' : c;
  }
  return line;
}

TEST(TheInstalledInterface, IsTheOneThatTheAgentServes) {
  EXPECT_EQ(declarationsIn(*contentOfFile(KVR_INTERFACE_FILE)),
            declarationsIn(introspectionDocument(agentServiceInterface())));
}

}  // namespace
}  // namespace kvr::testing
