#include "core/followup/KVRFollowUp.h"
#include "integration/support/AgentWorld.h"
#include "platform/codec/PropertyList.h"

#include <future>

namespace kvr::testing {
namespace {

constexpr const char* kFailure = "kvragent failed to load warranty";

/// A rule that sends these bytes instead of an answer, with further members of the rule in `further`.
std::string raw(const std::string& bytes, const std::string& further = "") {
  return R"("raw":")" + bytes + "\"" + (further.empty() ? "" : "," + further);
}
std::string endless(const std::string& bytes, const std::string& repeated) {
  return raw(bytes, R"("repeat":")" + repeated + "\"");
}

struct TheAgentOfAHostileService : ::testing::Test {
  TheAgentOfAHostileService() {
    world.startAgent();
    expectAnswer(World::Refresh);
  }
  void misbehave(const std::string& rule) const {
    world.misbehave(R"([{"serialNumber":"SNWATCH00002",)" + rule + "}]");
  }
  void expectAnswer(World::Policy policy) const {
    EXPECT_EQ(World::warrantyIn(World::info(client, World::kFirstWatch, policy))["covered"], Value(true));
  }

  AgentWorld world;
  const RawBusClient client = world.newClient();
};

TEST_F(TheAgentOfAHostileService, MakesTheAttemptsItMayAndFailsOnce) {
  world.setAccount(Dictionary{{"resultCode", 0},
                              {"tokens", Dictionary{{"com.tarsil.vornic.supportapp.auth", "renewed"}}}});
  const std::string kilobyte(1000, 'a');
  const std::string ok = R"(HTTP/1.1 200 OK\r\n)";
  const std::string five = ok + R"(Content-Length: 5\r\n\r\n)";
  // The answer to every request about the second watch.
  const std::pair<const char*, std::string> all[] = {
      {"endless headers", endless(ok, "X-More: " + kilobyte + R"(\r\n)")},
      {"an endless header", endless(ok + "X-More: ", kilobyte)},
      {"endless interim answers", endless("", R"(HTTP/1.1 103 Early Hints\r\n\r\n)")},
      {"an endless body", endless(ok + R"(\r\n)", kilobyte)},
      {"an endless chunked body",
       endless(ok + R"(Transfer-Encoding: chunked\r\n\r\n)", R"(3e8\r\n)" + kilobyte + R"(\r\n)")},
      {"an endless compressed body", endless(ok + R"(Content-Encoding: gzip\r\n\r\n)", kilobyte)},
      {"a compressed body nobody asked for",
       raw(ok + R"(Content-Encoding: gzip\r\nContent-Length: 2\r\n\r\nzz)")},
      {"a length above the body's", raw(five + "{}")},
      {"a length below the body's", raw(five + R"({\"covered\":true})")},
      {"a length that is no number", raw(ok + R"(Content-Length: -1\r\n\r\n{)")},
      {"reset in the headers", raw(ok, R"("end":"reset")")},
      {"reset in the body", raw(five + "{", R"("end":"reset")")},
      {"closed without a word", raw("")},
      {"a status line that is none", raw(R"(\u0001\u0002 200 OK\r\n\r\n)")},
      {"a status out of range", raw(R"(HTTP/1.1 99999 OK\r\n\r\n{})")},
      {"a redirect to another host", R"("redirect":"http://localhost:1/")"},
      {"a permanent redirect", R"("status":308,"redirect":"https://localhost:1/")"},
      {"nothing", R"("status":204)"},
      {"an error", R"("status":500)"},
      {"no JSON", R"("body":"garbage")"},
      {"half a body", R"("body":"truncated")"},
      {"1 MiB and a byte", R"("body":"oversize")"},
      {"a deep body", raw(ok + R"(\r\n)" + std::string(600, '[') + std::string(600, ']'))},
      {"401 for ever", R"("status":401)"},
      {"401 with an endless body", endless(R"(HTTP/1.1 401 No\r\n\r\n)", kilobyte)},
      {"half of a 401", raw(R"(HTTP/1.1 401 No\r\nContent-Length: 5\r\n\r\n)")}};
  for (const auto& [name, rule] : all) {
    misbehave(rule);
    const auto requests = world.coverageRequests().size();
    const auto from = world.agent().errorOutput().size();
    EXPECT_EQ(World::warrantyIn(World::info(client, World::kSecondWatch, World::Refresh)), Value()) << name;
    const auto attempts = std::string_view(name).starts_with("401 ") ? 3U : 1U;
    EXPECT_EQ(world.coverageRequests().size() - requests, attempts) << name;
    world.agent().waitForErrorOutput(kFailure, from);
    expectAnswer(World::Default);
  }
  EXPECT_THAT(describe(world.coverageRequests().back()["headers"]),
              HasSubstr("X-Tarsil-Vornic-Token, renewed"));
  EXPECT_FALSE(std::filesystem::exists(world.cacheFileOf(World::kSecondWatch)));
  EXPECT_EQ(world.agent().terminate(), 0);
  EXPECT_EQ(countOf(kFailure, world.agent().errorOutput()), std::size(all));
}

TEST_F(TheAgentOfAHostileService, AnswersFromTheCacheWhileTheServiceKeepsItWaiting) {
  const std::string started = R"(HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\n{)";
  std::vector<RawBusClient> waiting;
  for (const auto& rule : {std::string(R"("never":true)"), raw(started, R"("end":"hold")"),
                           raw(started, R"("repeat":" ","pace":1)")}) {
    misbehave(rule);
    const auto requests = world.coverageRequests().size();
    // In total more than the most connections to a host.
    for (int i = 0; i < 22; ++i) {
      waiting.push_back(world.newClient());
      waiting.back().send("GetDeviceInfoForSerialNumber", "st", {World::kSecondWatch, World::Refresh});
    }
    while (world.coverageRequests().size() == requests) expectAnswer(World::Default);
    expectAnswer(World::Default);
  }
  EXPECT_EQ(world.agent().terminate(), 0);
}

TEST_F(TheAgentOfAHostileService, AnswersWhoWaitsWhenItIsToldToEndAndLeavesWhatIsShown) {
  const std::string path = "Library/FollowUps/com.tarsil.Kavrel.plist";
  const Value shown = Dictionary{
      {"items", Array{Dictionary{
                    {"uniqueIdentifier", KVRFollowUp::uniqueIdentfierForSerialNumber(World::kSecondWatch)},
                    {"userInfo", Dictionary{{"FollowupSerialNumber", World::kSecondWatch}}}}}}};
  world.directory.write("home/" + path, *writePropertyList(shown, PropertyListEncoding::Binary));
  misbehave(R"("never":true)");
  const auto requests = world.coverageRequests().size();
  auto waiting = std::async(std::launch::async, [this] {
    return World::info(world.newClient(), World::kSecondWatch, World::Refresh);
  });
  while (world.coverageRequests().size() == requests) expectAnswer(World::Default);
  EXPECT_EQ(world.agent().terminate(), 0);
  EXPECT_TRUE(World::warrantyIn(waiting.get()).isNull());
  EXPECT_EQ(world.file(path), shown);
}

}  // namespace
}  // namespace kvr::testing
