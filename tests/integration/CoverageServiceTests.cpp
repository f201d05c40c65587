#include "Prelude.h"
#include "integration/support/ChildProcess.h"
#include "integration/support/HTTPClient.h"
#include "integration/support/Host.h"
#include "integration/support/TemporaryDirectory.h"
#include "local/keys/LocalCertificates.h"
#include "platform/codec/JSON.h"
#include "platform/text/Base64.h"

#include <stdlib.h>
#include <zlib.h>

#include <ctime>

namespace kvr::testing {
namespace {

std::string deflated(std::string text, int windowBits, int level = Z_BEST_COMPRESSION) {
  z_stream stream{};
  EXPECT_EQ(deflateInit2(&stream, level, Z_DEFLATED, windowBits, 8, Z_DEFAULT_STRATEGY), Z_OK);
  std::string out(text.size() + 100, '\0');
  stream.next_in = reinterpret_cast<Bytef*>(text.data());
  stream.avail_in = static_cast<uInt>(text.size());
  stream.next_out = reinterpret_cast<Bytef*>(out.data());
  stream.avail_out = static_cast<uInt>(out.size());
  EXPECT_EQ(deflate(&stream, Z_FINISH), Z_STREAM_END);
  out.resize(stream.total_out);
  deflateEnd(&stream);
  return out;
}

struct Identity {
  CertifiedKey authority = authorityOf(*newPrivateKey());
  openssl::Key key = *newPrivateKey();
  openssl::Certificate leaf =
      *newLeafCertificate(key, {}, authority, Date{static_cast<double>(std::time(nullptr))}, 60);

  static CertifiedKey authorityOf(const openssl::Key& key) { return {key, *newAuthorityCertificate(key)}; }
  /// The chain's JSON.
  std::string chain(JSONSlashes slashes = JSONSlashes::Escaped) const {
    const Array certificates{base64Encode(*derOf(leaf)), base64Encode(*derOf(authority.certificate))};
    return *writeJSON(Dictionary{{"certs", certificates}}, slashes);
  }
  void attest(HTTPRequest& request) const {
    request.headers.set("X-Tarsil-Kest-S", base64Encode(*sign(key, request.body)));
    request.headers.set("X-Tarsil-Kest", base64Encode(deflated(chain(), -MAX_WBITS)));
  }
};

/// The parameter is the scheme.
struct ACoverageService : ::testing::TestWithParam<const char*> {
  ACoverageService() {
    directory_.write("coverage/default.json", R"({"from":"default"})");
    directory_.write("Accounts.plist",
                     R"({ primaryAccount = { altDSID = "000-1"; storefront = "143441";
                          authenticationAccount = { tokens = { com.tarsil.vornic.supportapp.auth = token; }; }; };
                          sessionHeaders = { clientInfo = { X-Client = client; }; }; })");
  }

  void start(const std::vector<std::string>& more = {}) {
    std::vector<std::string> arguments{KVR_PROGRAMS "/kvr-coverage-service", "--root", directory_.path(),
                                       "--tls", directory_ / "authorities.pem"};
    arguments.insert(arguments.end(), more.begin(), more.end());
    service_.emplace(arguments);
    const std::string line = service_->waitForOutput("listening on http://127.0.0.1:");
    url_ = GetParam() + line.substr(line.find("://"));
    ::setenv(kTrustedAuthorities, (directory_ / "authorities.pem").c_str(), 1);
  }
  HTTPRequest goodRequest() const {
    HTTPRequest request;
    request.method = "POST";
    request.url = url_ + "/api/v3/coverage/summary";
    for (const auto& [name, value] : {std::pair("X-Tarsil-Vornic-Token", "token"),
                                      {"X-Client", "client"},
                                      {"altDSID", "000-1"},
                                      {"User-Agent", "<com.tarsil.kvragent/17.0/Phone1,1>"},
                                      {"storefrontLocale", "143441"},
                                      {"Content-Type", "application/json"}}) {
      request.headers.set(name, value);
    }
    request.body = R"({"locale":"en_US","requestTimestamp":)" + std::to_string(std::time(nullptr)) +
                   R"(123,"requestTimezone":-3,"serialNumber":"S1"})";
    return request;
  }
  /// The status and body of the answer.
  std::string ask(const HTTPRequest& request) {
    const HTTPResponse answer = client_.exchange(request);
    return std::to_string(answer.status) + " " + answer.body.value_or("");
  }

  TemporaryDirectory directory_;
  std::string url_;

 private:
  HTTPClient client_;
  std::optional<ChildProcess> service_;
};

TEST_P(ACoverageService, RefusesEveryBrokenRuleWithAReason) {
  const Identity identity;
  const Identity stranger;
  start({"--accounts", directory_ / "Accounts.plist", "--authority", directory_ / "authority.pem"});
  HTTPRequest good = goodRequest();
  identity.attest(good);
  EXPECT_THAT(ask(good), HasSubstr("the authority's file cannot be read"));
  directory_.write("authority.pem", *pemOf(identity.authority.certificate));
  EXPECT_EQ(ask(good), R"(200 {"from":"default"})");

  using Case = std::pair<const char*, std::function<void(HTTPRequest&)>>;
  const auto set = [](const char* name, const std::optional<std::string>& value) {
    return [=](HTTPRequest& request) { request.headers.set(name, value); };
  };
  const auto replace = [](const std::string& part, const char* other) {
    return [=](HTTPRequest& request) { request.body.replace(request.body.find(part), part.size(), other); };
  };
  const auto chain = [&set](const std::string& bytes) { return set("X-Tarsil-Kest", base64Encode(bytes)); };
  const Case signedCases[] = {
      {"the method is not POST", [](auto& request) { request.method = "PUT"; }},
      {"Content-Type", set("Content-Type", "application/json; charset=utf-8")},
      {"X-Tarsil-Vornic-Token is not the account's", set("X-Tarsil-Vornic-Token", "other")},
      {"altDSID", set("altDSID", "000-2")},
      {"storefrontLocale", set("storefrontLocale", "143442")},
      {"X-Client", set("X-Client", std::nullopt)},
      {"User-Agent", set("User-Agent", "com.tarsil.kvragent/17.0/Phone1,1")},
      {"not JSON", replace("}", "")},
      {"not compact", replace(",", ", ")},
      {"members of no meaning", replace("{", "{\"a\":1,")},
      {"a member twice", replace("{", "{\"locale\":\"a\",")},
      {"requestTimestamp is not an unsigned", replace("123,", "123.5,")},
      {"requestTimezone is not in whole hours", replace("-3", "-10800")},
      {"serialNumber", replace("\"S1\"", "1")},
      {"locale is not a text", replace("en_US", "")}};
  const Case unsignedCases[] = {
      {"attested", [&](auto& request) { request.url = url_ + "/api/v2/coverage/summary"; }},
      {"there is no X-Tarsil-Kest-S", set("X-Tarsil-Kest-S", std::nullopt)},
      {"not the leaf's over the body", replace("S1", "S2")},
      {"the chain is not base64", set("X-Tarsil-Kest", "!")},
      {"not one raw DEFLATE stream", chain(deflated(identity.chain(), MAX_WBITS))},
      {"not become smaller", chain(deflated(identity.chain(), -MAX_WBITS, Z_NO_COMPRESSION))},
      {"not compact with each", chain(deflated(identity.chain(JSONSlashes::Plain), -MAX_WBITS))},
      {"not the leaf's over the body", chain(deflated(stranger.chain(), -MAX_WBITS))},
      {"does not lead to the authority", [&](auto& request) { stranger.attest(request); }}};
  const auto expectRefusal = [this](const HTTPRequest& request, const char* reason) {
    EXPECT_THAT(ask(request), AllOf(::testing::StartsWith("400 "), HasSubstr(reason)));
  };
  for (const auto& [reason, change] : signedCases) {
    HTTPRequest request = goodRequest();
    change(request);
    identity.attest(request);
    expectRefusal(request, reason);
  }
  for (const auto& [reason, change] : unsignedCases) {
    HTTPRequest request = good;
    change(request);
    expectRefusal(request, reason);
  }
}

INSTANTIATE_TEST_SUITE_P(Over, ACoverageService, ::testing::Values("http", "https"));

TEST_P(ACoverageService, ChecksAnAttestationThatNobodyAskedFor) {
  start();
  HTTPRequest request = goodRequest();
  EXPECT_THAT(ask(request), HasSubstr("200 "));
  Identity().attest(request);
  EXPECT_THAT(ask(request), HasSubstr("200 "));
  request.body.replace(request.body.find("S1"), 2, "S2");
  EXPECT_THAT(ask(request), HasSubstr("400 "));
}

}  // namespace
}  // namespace kvr::testing
