#include "integration/support/ChildProcess.h"
#include "integration/support/TemporaryDirectory.h"
#include "platform/Base64.h"
#include "platform/JSON.h"
#include "platform/local/Descriptor.h"
#include "platform/local/LocalCertificates.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <zlib.h>

#include <csignal>
#include <ctime>
#include <fstream>
#include <functional>
#include <iterator>

namespace kvr::testing {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

constexpr char kLocal[] = "/api/v3/coverage/summary";
constexpr char kOther[] = "/api/v2/coverage/summary";

std::string base64(std::string_view bytes) {
  return base64Encode({reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()});
}

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
  /// The JSON of the chain.
  std::string chain(JSONSlashes slashes = JSONSlashes::Escaped) const {
    const Value::Array certificates{base64(*derOf(leaf)), base64(*derOf(authority.certificate))};
    return *writeJSON(Value::Dictionary{{"certs", certificates}}, slashes);
  }
};

/// A request of which every part can be spoilt.
struct Request {
  std::string method = "POST";
  std::string path = kLocal;
  std::vector<std::pair<std::string, std::string>> headers;
  std::string body;

  void set(const std::string& name, const std::string& value) {
    remove(name);
    headers.emplace_back(name, value);
  }
  void remove(const std::string& name) {
    std::erase_if(headers, [&](const auto& header) { return header.first == name; });
  }
  void replaceInBody(const std::string& part, const std::string& other) {
    const auto at = body.find(part);
    ASSERT_NE(at, std::string::npos) << part;
    body.replace(at, part.size(), other);
  }
  void attest(const Identity& identity) {
    set("X-Tarsil-Kest-S", base64(*sign(identity.key, body)));
    set("X-Tarsil-Kest", base64(deflated(identity.chain(), -MAX_WBITS)));
  }
};

Request goodRequest() {
  Request request;
  request.headers = {{"X-Tarsil-Vornic-Token", "token"},
                     {"X-Client", "client"},
                     {"altDSID", "000-1"},
                     {"User-Agent", "<com.tarsil.kvragent/17.0/Phone1,1>"},
                     {"storefrontLocale", "143441"},
                     {"Content-Type", "application/json"}};
  request.body = R"({"locale":"en_US","requestTimestamp":)" + std::to_string(std::time(nullptr)) +
                 R"(123,"requestTimezone":-3,"serialNumber":"S1"})";
  return request;
}

class ACoverageService : public ::testing::Test {
 protected:
  ACoverageService() {
    directory_.write("coverage/default.json", R"({"from":"default"})");
    directory_.write("coverage/S1.json", R"({"from":"S1"})");
    directory_.write("coverage/S1.de_DE.json", R"({"from":"S1 de_DE"})");
    directory_.write("secret.json", R"({"from":"secret"})");
    directory_.write("kvrV2.plist", "asset");
    directory_.write("Accounts.plist", R"(<plist><dict>
        <key>primaryAccount</key><dict>
          <key>altDSID</key><string>000-1</string><key>storefront</key><string>143441</string>
          <key>authenticationAccount</key><dict>
            <key>tokens</key><dict><key>com.tarsil.vornic.supportapp.auth</key><string>token</string></dict>
            <key>renewal</key><dict><key>tokens</key><dict>
              <key>com.tarsil.vornic.supportapp.auth</key><string>renewed</string></dict></dict></dict></dict>
        <key>sessionHeaders</key><dict><key>clientInfo</key><dict>
          <key>X-Client</key><string>client</string></dict></dict></dict></plist>)");
  }

  void start(const std::vector<std::string>& more = {}) {
    std::vector<std::string> arguments{KVR_PROGRAMS "/kvr-coverage-service", "--root", directory_.path()};
    arguments.insert(arguments.end(), more.begin(), more.end());
    service_.emplace(arguments);
    const std::string line = service_->waitForOutput("listening on http://127.0.0.1:");
    port_ = static_cast<std::uint16_t>(std::stoi(line.substr(line.rfind(':') + 1)));
  }
  ChildProcess& service() { return *service_; }
  const TemporaryDirectory& directory() const { return directory_; }

  Descriptor send(const Request& request) const {
    Descriptor client(socket(AF_INET, SOCK_STREAM, 0));
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(port_);
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    EXPECT_EQ(connect(client.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    std::string text = request.method + " " + request.path + " HTTP/1.1\r\nHost: a\r\nConnection: close\r\n";
    for (const auto& [name, value] : request.headers)
      text.append(name).append(": ").append(value).append("\r\n");
    text += "Content-Length: " + std::to_string(request.body.size()) + "\r\n\r\n" + request.body;
    EXPECT_EQ(::send(client.get(), text.data(), text.size(), MSG_NOSIGNAL),
              static_cast<ssize_t>(text.size()));
    return client;
  }
  static std::string answer(const Descriptor& client) {
    std::string text;
    char buffer[4096];
    for (ssize_t count = 1; count > 0;
         text.append(buffer, static_cast<std::size_t>(std::max<ssize_t>(count, 0)))) {
      count = recv(client.get(), buffer, sizeof buffer, 0);
    }
    return text;
  }
  std::string ask(const Request& request) const { return answer(send(request)); }
  std::string tell(const std::string& control) const { return ask({"POST", "/control", {}, control}); }
  Value record(const std::string& name) const {
    std::ifstream in(directory_ / ("requests/" + name));
    return *readJSON(std::string(std::istreambuf_iterator<char>(in), {}));
  }

 private:
  TemporaryDirectory directory_;
  std::optional<ChildProcess> service_;
  std::uint16_t port_ = 0;
};

TEST_F(ACoverageService, RefusesEveryBrokenRuleWithAReason) {
  const Identity identity;
  const Identity stranger;
  start({"--accounts", directory() / "Accounts.plist", "--authority", directory() / "authority.pem"});
  Request good = goodRequest();
  good.attest(identity);
  EXPECT_THAT(ask(good), HasSubstr("the authority's file cannot be read"));
  directory().write("authority.pem", *pemOf(identity.authority.certificate));
  EXPECT_THAT(ask(good), StartsWith("HTTP/1.1 200"));
  Request renewed = goodRequest();
  renewed.path = kOther;
  renewed.set("X-Tarsil-Vornic-Token", "renewed");
  EXPECT_THAT(ask(renewed), StartsWith("HTTP/1.1 200"));

  using Change = std::function<void(Request&)>;
  const auto set = [](const char* name, const std::string& value) {
    return [=](Request& request) { request.set(name, value); };
  };
  const auto remove = [](const char* name) { return [=](Request& request) { request.remove(name); }; };
  const auto replace = [](const char* part, const char* other) {
    return [=](Request& request) { request.replaceInBody(part, other); };
  };
  const auto chain = [&set](const std::string& bytes) { return set("X-Tarsil-Kest", base64(bytes)); };
  struct Case {
    const char* reason;
    Change change;
  };
  const Case signedCases[] = {
      {"the method is not POST", [](Request& request) { request.method = "PUT"; }},
      {"Content-Type", set("Content-Type", "application/json; charset=utf-8")},
      {"there is no X-Tarsil-Vornic-Token", remove("X-Tarsil-Vornic-Token")},
      {"X-Tarsil-Vornic-Token is not the account's", set("X-Tarsil-Vornic-Token", "other")},
      {"altDSID", remove("altDSID")},
      {"altDSID", set("altDSID", "000-2")},
      {"storefrontLocale", set("storefrontLocale", "143442")},
      {"X-Client", remove("X-Client")},
      {"User-Agent", set("User-Agent", "com.tarsil.kvragent/17.0/Phone1,1")},
      {"User-Agent", set("User-Agent", "<com.tarsil.kvragent/17.0>")},
      {"twice", [](Request& request) { request.headers.emplace_back("ALTDSID", "000-1"); }},
      {"not JSON", replace("}", "")},
      {"not an object", [](Request& request) { request.body = "[]"; }},
      {"not compact", replace(",", ", ")},
      {"no member \"locale\"", replace("\"locale\"", "\"Locale\"")},
      {"members of no meaning", replace("{", "{\"a\":1,")},
      {"a member twice", replace("{", "{\"locale\":\"a\",")},
      {"requestTimestamp is not in milliseconds", replace("123,", ",")},
      {"requestTimestamp is not an unsigned", replace("123,", "123.5,")},
      {"requestTimestamp is not an unsigned", replace("Timestamp\":", "Timestamp\":-")},
      {"requestTimezone is not an integer", replace("-3", "-3.0")},
      {"requestTimezone is not in whole hours", replace("-3", "-10800")},
      {"serialNumber", replace("\"S1\"", "1")},
      {"locale is not a text", replace("en_US", "")},
  };
  const Case unsignedCases[] = {
      {"attested", [](Request& request) { request.path = kOther; }},
      {"there is no X-Tarsil-Kest-S", remove("X-Tarsil-Kest-S")},
      {"there is no X-Tarsil-Kest", remove("X-Tarsil-Kest")},
      {"not the leaf's over the body", replace("S1", "S2")},
      {"the signature is not base64", set("X-Tarsil-Kest-S", "a b=")},
      {"not the leaf's over the body", set("X-Tarsil-Kest-S", base64("signature"))},
      {"the chain is not base64", set("X-Tarsil-Kest", "!")},
      {"not one raw DEFLATE stream", chain(deflated(identity.chain(), MAX_WBITS))},
      {"not one raw DEFLATE stream", chain(deflated(identity.chain(), -MAX_WBITS) + "a")},
      {"not one raw DEFLATE stream", chain(identity.chain())},
      {"not become smaller", chain(deflated(identity.chain(), -MAX_WBITS, Z_NO_COMPRESSION))},
      {"not compact with each", chain(deflated(identity.chain(JSONSlashes::Plain) + " ", -MAX_WBITS))},
      {"the one member", chain(deflated(R"({"certs":[],"a":"aaaaaaaaaaaaaaaaaaaa"})", -MAX_WBITS))},
      {"not the leaf's over the body", chain(deflated(stranger.chain(), -MAX_WBITS))},
      {"does not lead to the authority", [&stranger](Request& request) { request.attest(stranger); }},
  };
  const auto expectRefusal = [this](const Request& request, const char* reason) {
    const std::string got = ask(request);
    EXPECT_THAT(got, StartsWith("HTTP/1.1 400")) << reason;
    EXPECT_THAT(got, HasSubstr(reason));
  };
  for (const auto& [reason, change] : signedCases) {
    Request request = goodRequest();
    change(request);
    request.attest(identity);
    expectRefusal(request, reason);
  }
  for (const auto& [reason, change] : unsignedCases) {
    Request request = good;
    change(request);
    expectRefusal(request, reason);
  }
}

TEST_F(ACoverageService, ChecksAnAttestationThatNobodyAskedFor) {
  start();
  Request request = goodRequest();
  EXPECT_THAT(ask(request), StartsWith("HTTP/1.1 200"));
  request.attest(Identity());
  EXPECT_THAT(ask(request), StartsWith("HTTP/1.1 200"));
  request.replaceInBody("S1", "S2");
  EXPECT_THAT(ask(request), StartsWith("HTTP/1.1 400"));
}

}  // namespace
}  // namespace kvr::testing
