#include "integration/support/AgentWorld.h"

namespace kvr::testing {
namespace {

struct TheAgentOverTLS : ::testing::Test {
  void SetUp() override {
    if (KVR_SANITIZED) GTEST_SKIP() << "a sanitizer's runtime stands before the preloaded calls";
    // A system that does not refuse old versions of TLS itself.
    const auto settings =
        world.directory.write("openssl.cnf",
                              "openssl_conf = a\n[a]\nssl_conf = b\n[b]\nsystem_default = c\n"
                              "[c]\nMinProtocol = TLSv1\nCipherString = ALL@SECLEVEL=0\n");
    world.moreEnvironment = {{"OPENSSL_CONF", settings}};
    world.startAgent();
  }
  Value coverage() const {
    return World::warrantyIn(World::info(world.newClient(), World::kPhone, World::Refresh))["covered"];
  }

  AgentWorld world;
};

TEST_F(TheAgentOverTLS, SendsNothingToAServiceThatItCannotTrust) {
  const std::tuple<std::string, const char*, int> all[] = {
      {R"("certificate":"self-signed")", "self-signed certificate", 60},
      {R"("certificate":"unknown")", "unable to get local issuer certificate", 60},
      {R"("certificate":"elsewhere")", "no alternative certificate subject name matches", 60},
      {R"("certificate":"expired")", "certificate has expired", 60},
      {R"("certificate":"early")", "certificate is not yet valid", 60},
      {R"("oldTLS":true)", "protocol version", 35}};
  for (const std::string host : {"127.0.0.1", "coverage.example"}) {
    world.setServiceURL("https://" + host + ":" + world.port());
    for (const auto& [rule, reason, code] : all) {
      SCOPED_TRACE(rule);
      world.misbehave("[{" + rule + "}]", "connection");
      const Value before = world.counts();
      const auto from = world.agent().errorOutput().size();
      EXPECT_EQ(coverage(), Value());
      const Value after = world.counts();
      EXPECT_EQ(after["connections"].integer() - before["connections"].integer(), 2) << "asset and coverage";
      for (const auto* none : {"bytes", "count"}) EXPECT_EQ(after[none], before[none]) << none;
      for (const std::string line : {"Failed to fetch plist data from URL ", "load warranty status: 0 : "}) {
        EXPECT_THAT(world.agent().waitForErrorOutput(line, from),
                    AllOf(HasSubstr("Domain=http Code=" + std::to_string(code)), HasSubstr(reason)));
      }
    }
  }
}

TEST_F(TheAgentOverTLS, IsNotLedFromAnotherHostToOneWithoutIt) {
  const std::string elsewhere = R"([{"redirect":"http://127.0.0.1:)" + world.port() + "/\"}]";
  world.setServiceURL("https://coverage.example:" + world.port());
  world.misbehave(elsewhere, "asset");
  EXPECT_EQ(coverage(), Value(true)) << "the agent goes by its own versions";
  world.agent().waitForErrorOutput("redirected to what is not https");
  world.misbehave(elsewhere);
  EXPECT_EQ(coverage(), Value());
  world.agent().waitForErrorOutput("load warranty status: 302");
  EXPECT_THAT(world.requests(), SizeIs(4));
  for (const auto& request : world.requests()) EXPECT_EQ(request["tls"], Value("TLSv1.3"));
}

TEST_F(TheAgentOverTLS, SendsATrustedServiceExactlyTheHeadersOfItsSession) {
  // Asked for again past all caches, because it is no dictionary.
  world.misbehave(R"-([{"raw":"HTTP/1.1 200 OK\r\nSet-Cookie: a=b; Path=/\r\nETag: \"1\"\r\n)-"
                  R"-(Cache-Control: max-age=9\r\nConnection: close\r\nContent-Length: 3\r\n\r\n(1)"}])-",
                  "asset");
  EXPECT_EQ(coverage(), Value(true));
  std::vector<std::string> seen;
  for (const auto& request : world.requests()) {
    std::string text =
        request["tls"].string() + " " + request["version"].string() + " " + request["method"].string();
    for (const auto& field : request["headers"].array()) {
      const auto& name = field.array()[0].string();
      const bool differs = name == "Host" || name == "Content-Length" || name.starts_with("X-Tarsil-Kest");
      text += "|" + name + (differs ? "" : ": " + field.array()[1].string());
    }
    seen.push_back(std::move(text));
  }
  EXPECT_THAT(
      seen,
      ElementsAre("TLSv1.3 HTTP/1.1 GET|Host",
                  "TLSv1.3 HTTP/1.1 GET|Host|Cache-Control: no-cache|Pragma: no-cache",
                  "TLSv1.3 HTTP/1.1 POST|Host|X-Tarsil-Vornic-Token: first-token|X-Client: c|X-Device: d"
                  "|X-Proof: p|altDSID: alt|User-Agent: <com.tarsil.kvragent/17.9/Phone1,2>"
                  "|storefrontLocale: 143441|Content-Type: application/json|X-Tarsil-Kest-S"
                  "|X-Tarsil-Kest|Content-Length"));
}

}  // namespace
}  // namespace kvr::testing
