#include "Prelude.h"
#include "integration/support/HTTPClient.h"
#include "integration/support/Host.h"
#include "integration/support/TemporaryDirectory.h"
#include "local/system/Descriptor.h"
#include "tls/Authority.h"
#include "tls/Stream.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <stdlib.h>
#include <sys/socket.h>

#include <atomic>
#include <latch>
#include <list>
#include <thread>

namespace kvr::testing {
namespace {

constexpr std::size_t kMebibyte = std::size_t{1} << 20;
constexpr int kConnections = 64;  // per host
constexpr int kCouldNotConnect = 7;
constexpr int kTimedOut = 28;
constexpr int kNoHandshake = 35;
constexpr int kTooManyRedirects = 47;
constexpr int kNoAnswer = 52;
constexpr int kAborted = 42;
constexpr int kTooLarge = 63;

/// The server's end of one connection.
class Peer {
 public:
  Peer(int descriptor, std::unique_ptr<tls::Stream> tls) : descriptor_(descriptor), tls_(std::move(tls)) {}

  /// The next request, headers and body; empty when the client has gone.
  std::string request() {
    std::size_t length = std::string::npos;
    while (unread_.size() < length) {
      if (const auto head = unread_.find("\r\n\r\n");
          head != std::string::npos && length == std::string::npos) {
        const auto field = unread_.find("Content-Length: ");
        length = head + 4 + (field < head ? std::stoul(unread_.substr(field + 16)) : 0);
        continue;
      }
      char buffer[4096];
      const auto count =
          tls_ ? tls_->read(buffer, sizeof buffer) : recv(descriptor_, buffer, sizeof buffer, 0);
      if (count <= 0) return {};
      unread_.append(buffer, static_cast<std::size_t>(count));
    }
    std::string request = unread_.substr(0, length);
    unread_.erase(0, length);
    return request;
  }
  /// False when the client has gone.
  bool write(std::string_view bytes) const {
    if (tls_) return tls_->write(bytes);
    while (!bytes.empty()) {
      const auto count = send(descriptor_, bytes.data(), bytes.size(), MSG_NOSIGNAL);
      if (count <= 0) return false;
      bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
  }

 private:
  const int descriptor_;
  const std::unique_ptr<tls::Stream> tls_;
  std::string unread_;
};

/// Each test runs over plain connections and over TLS; the parameter is the scheme.
using OverBoth = ::testing::TestWithParam<const char*>;

/// Trusted by this process.
const tls::Authority& authority() {
  static const tls::Authority trusted;
  static const TemporaryDirectory directory;
  ::setenv(kTrustedAuthorities, directory.write("authorities.pem", trusted.pem()).c_str(), 1);
  return trusted;
}

/// A server on a loopback port that runs its script for every connection; a connection ends when the script
/// returns.
class ScriptedServer {
 public:
  using Script = std::function<void(Peer&)>;

  explicit ScriptedServer(Script script, std::string scheme = OverBoth::GetParam())
      : script_(std::move(script)), scheme_(std::move(scheme)) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t size = sizeof address;
    EXPECT_EQ(bind(listener_.get(), reinterpret_cast<sockaddr*>(&address), size), 0);
    EXPECT_EQ(listen(listener_.get(), 256), 0);
    getsockname(listener_.get(), reinterpret_cast<sockaddr*>(&address), &size);
    host_ = "127.0.0.1:" + std::to_string(ntohs(address.sin_port));
    acceptor_ = std::thread([this] { accept(); });
  }
  ~ScriptedServer() {
    shutdown(listener_.get(), SHUT_RDWR);
    acceptor_.join();
    for (const auto& [descriptor, thread] : connections_) shutdown(descriptor.get(), SHUT_RDWR);
    for (auto& [descriptor, thread] : connections_) thread.join();
  }

  const std::string& host() const { return host_; }
  /// With its colon.
  std::string port() const { return host_.substr(host_.find(':')); }
  std::string url(const std::string& path = "/") const { return scheme_ + "://" + host_ + path; }
  int connections() const { return accepted_; }
  int mostConnectionsAtOnce() const { return mostOpen_; }

 private:
  void accept() {
    while (true) {
      const int descriptor = ::accept(listener_.get(), nullptr, nullptr);
      if (descriptor < 0) return;
      ++accepted_;
      mostOpen_ = std::max<int>(mostOpen_, ++open_);
      connections_.emplace_back(descriptor, std::thread([this, descriptor] {
                                  if (scheme_ == "http") {
                                    Peer peer(descriptor, nullptr);
                                    script_(peer);
                                  } else if (auto tls = tls::Stream::accept(descriptor, identity_)) {
                                    Peer peer(descriptor, std::move(tls));
                                    script_(peer);
                                  }
                                  --open_;
                                  shutdown(descriptor, SHUT_RDWR);
                                }));
    }
  }

  const Script script_;
  const std::string scheme_;
  const CertifiedKey identity_ = authority().issue();
  const Descriptor listener_{socket(AF_INET, SOCK_STREAM, 0)};
  std::string host_;
  std::atomic<int> accepted_{0};
  std::atomic<int> open_{0};
  std::atomic<int> mostOpen_{0};
  std::list<std::pair<Descriptor, std::thread>> connections_;
  std::thread acceptor_;
};

std::string response(std::string_view status, std::string_view body) {
  return "HTTP/1.1 " + std::string(status) + "\r\nContent-Length: " + std::to_string(body.size()) +
         "\r\n\r\n" + std::string(body);
}

/// Answers the first request of a connection with the given bytes.
ScriptedServer::Script sends(std::string bytes) {
  return [bytes = std::move(bytes)](Peer& peer) {
    peer.request();
    peer.write(bytes);
  };
}

/// Answers every request of a connection with the request itself.
void echo(Peer& peer) {
  for (auto request = peer.request(); !request.empty(); request = peer.request()) {
    if (!peer.write(response("200 OK", request))) return;
  }
}

/// Reads requests and never answers.
void keepSilent(Peer& peer) {
  while (!peer.request().empty()) {
  }
}

class OverHTTP : public OverBoth, protected HTTPClient {};
INSTANTIATE_TEST_SUITE_P(Over, OverHTTP, ::testing::Values("http", "https"));

/// The error's code, 0 without an error.
std::int64_t codeOf(const HTTPResponse& response) {
  EXPECT_EQ(response.error.has_value(), !response.body.has_value());
  if (!response.error) return 0;
  EXPECT_EQ(response.error->domain, "http");
  EXPECT_FALSE(response.error->message.empty());
  return response.error->code;
}

HTTPRequest get(std::string url) {
  HTTPRequest request;
  request.url = std::move(url);
  return request;
}

HTTPRequest post(std::string url, std::string body) {
  HTTPRequest request = get(std::move(url));
  request.method = "POST";
  request.body = std::move(body);
  request.followsRedirects = false;
  return request;
}

TEST_P(OverHTTP, ARequestIsSentExactlyAsItWasGiven) {
  const ScriptedServer server(echo);
  const std::string host = "Host: " + server.host() + "\r\n";

  HTTPRequest full = post(server.url("/a/../b?c=%20"), "{\"a\":1}");
  for (const auto& [name, value] : {std::pair("X-Second", "2"),
                                    {"X-First", " padded\t"},
                                    {"X-Empty", ""},
                                    {"User-Agent", "<a/b/c>"},
                                    {"Content-Type", "application/json"}}) {
    full.headers.set(name, value);
  }
  HTTPRequest remove = get(server.url());
  remove.method = "DELETE";
  HTTPRequest getWithBody = get(server.url());
  getWithBody.body = "b";

  EXPECT_EQ(exchange(get(server.url("/x#y"))).body, "GET /x HTTP/1.1\r\n" + host + "\r\n");
  EXPECT_EQ(exchange(full).body,
            "POST /a/../b?c=%20 HTTP/1.1\r\n" + host +
                "X-Second: 2\r\nX-First:  padded\t\r\nX-Empty:\r\nUser-Agent: <a/b/c>\r\n"
                "Content-Type: application/json\r\nContent-Length: 7\r\n\r\n{\"a\":1}");
  EXPECT_EQ(exchange(post(server.url(), "")).body,
            "POST / HTTP/1.1\r\n" + host + "Content-Length: 0\r\n\r\n");
  EXPECT_EQ(exchange(remove).body, "DELETE / HTTP/1.1\r\n" + host + "\r\n");
  EXPECT_EQ(exchange(getWithBody).body, "GET / HTTP/1.1\r\n" + host + "Content-Length: 1\r\n\r\nb");
  EXPECT_EQ(start(*http().newUncachedSession(), get(server.url())).get().body,
            "GET / HTTP/1.1\r\n" + host + "Cache-Control: no-cache\r\nPragma: no-cache\r\n\r\n");
  EXPECT_EQ(server.connections(), 1);
}

TEST_P(OverHTTP, AResponseIsTakenOnlyWhole) {
  const std::string mebibyte(kMebibyte, 'a');
  const std::string untilClosed = "HTTP/1.1 200 OK\r\n\r\n";
  const std::string chunked = "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n";
  const std::string oneChunk = chunked + "100000\r\n" + mebibyte + "\r\n";
  const auto movedTo = [](const std::string& location) {
    return "HTTP/1.1 301 Moved\r\nLocation: " + location + "\r\nContent-Length: 1\r\n\r\nr";
  };
  const std::optional<std::string> none;
  const std::tuple<const char*, std::string, int, std::optional<std::string>, int> cases[] = {
      {"plain", response("404 Not Found", "no"), 404, "no", 0},
      {"until closed", untilClosed + "all", 200, "all", 0},
      {"exactly 1 MiB", response("200 OK", mebibyte), 200, mebibyte, 0},
      {"a byte more", response("401 Unauthorized", mebibyte + "a"), 401, none, kTooLarge},
      {"1 MiB in chunks", oneChunk + "0\r\n\r\n", 200, mebibyte, 0},
      {"a chunk more", oneChunk + "1\r\na\r\n0\r\n\r\n", 200, none, kTooLarge},
      {"broken chunk", chunked + "zz\r\n", 0, none, 56},
      {"redirect to plain http elsewhere", movedTo("http://a.example/"), 301, none, 1},
      {"redirect to a file", movedTo("file:///etc/hosts"), 301, none, 1},
      {"redirect to https", movedTo("https://127.0.0.1:1/"), 0, none, kCouldNotConnect},
      {"another answer with a location",
       "HTTP/1.1 201 Created\r\nLocation: https://127.0.0.1:1/\r\nContent-Length: 1\r\n\r\nc", 201, "c", 0}};
  for (const auto& [name, sent, status, body, code] : cases) {
    SCOPED_TRACE(name);
    const ScriptedServer server(sends(sent));
    const HTTPResponse got = exchange(get(server.url()));
    EXPECT_EQ(got.status, status);
    EXPECT_TRUE(got.body == body) << got.body.value_or("none").substr(0, 100);
    EXPECT_EQ(codeOf(got), code);
  }
  const ScriptedServer target(echo);
  const auto port = target.port();
  const ScriptedServer source(sends(movedTo(GetParam() + ("://localhost" + port + "/there"))));
  HTTPRequest identifying = get(source.url());
  for (const auto* name : {"X-Token", "Accept"}) identifying.headers.set(name, "a");
  EXPECT_EQ(exchange(identifying).body,
            "GET /there HTTP/1.1\r\nHost: localhost" + port + "\r\nAccept: a\r\n\r\n");
  const ScriptedServer circle([&](Peer& peer) {
    while (!peer.request().empty() && peer.write(movedTo("/"))) {
    }
  });
  EXPECT_EQ(codeOf(exchange(get(circle.url()))), kTooManyRedirects);
  for (const bool isPost : {false, true}) {
    const ScriptedServer server(sends(movedTo("https://127.0.0.1:1/")));
    HTTPRequest unfollowed = isPost ? post(server.url(), "{}") : get(server.url());
    unfollowed.followsRedirects = false;
    EXPECT_EQ(exchange(unfollowed).body, "r");
  }
}

TEST_P(OverHTTP, AnExchangeEndsAtItsLimitWhereverItStops) {
  const ScriptedServer other(echo);
  // After so many seconds the client looks at its limits, because another exchange begins.
  const auto pass = [&](HTTPClient& client, int seconds) {
    clockAhead += seconds;
    EXPECT_EQ(client.exchange(get(other.url())).status, 200);
  };
  const std::string half = "HTTP/1.1 200 OK\r\nContent-Length: 5\r\n\r\nf";
  const std::tuple<const char*, std::string, bool, int> cases[] = {{"at the handshake", "", false, 0},
                                                                   {"before the answer", "", true, 0},
                                                                   {"in the answer", half, true, 0},
                                                                   {"without a connection", "", true, 64}};
  for (const auto& [name, sent, greets, others] : cases) {
    SCOPED_TRACE(name);
    std::latch allCame(std::max(others, 1));
    const ScriptedServer server(
        [&allCame, isGreeted = greets, part = sent](Peer& peer) {
          if (isGreeted) peer.request();
          peer.write(part);
          allCame.count_down();
          keepSilent(peer);
        },
        greets ? GetParam() : "http");
    HTTPRequest request = get(GetParam() + ("://" + server.host()));
    HTTPClient client;
    std::vector<std::future<HTTPResponse>> before;
    for (int i = 0; i < others; ++i) before.push_back(client.start(request));
    if (others > 0) allCame.wait();
    request.timeout = 30;
    auto reply = client.start(request);
    allCame.wait();
    pass(client, 29);
    EXPECT_EQ(reply.wait_for(std::chrono::seconds(0)), std::future_status::timeout);
    pass(client, 2);
    client.end();
    EXPECT_EQ(codeOf(reply.get()), kTimedOut);
    for (auto& earlier : before) EXPECT_EQ(codeOf(earlier.get()), kAborted);
    clockAhead = 0;
  }
}

TEST_P(OverHTTP, WhatMustNotBeSentFailsWithoutAConnection) {
  const ScriptedServer server(echo);
  using namespace std::string_literals;
  std::vector<HTTPRequest> refused;
  const auto add = [&](const std::string& url) -> HTTPRequest& { return refused.emplace_back(get(url)); };
  for (const auto& bad : {"a\r\nX-B: b"s, "a\nb"s, "a\rb"s, "a\0b"s})
    add(server.url()).headers.set("X-A", bad);
  for (const auto& name : {""s, "X A"s, "X-A:"s, "X-A\r\nX-B"s, "X-A\0"s, "X-\xC3\xA4"s, "Content-Length"s,
                           "transfer-encoding"s}) {
    add(server.url()).headers.set(name, "0");
  }
  for (const auto* method : {"", "GET /x HTTP/1.1\r\nX:", "G T"}) add(server.url()).method = method;
  for (const auto& url : {"file:///etc/hosts"s, "ftp://127.0.0.1/"s, "http://a.example" + server.port(), ""s,
                          "http://localhost@a.example/"s, server.url("/ HTTP/1.1\r\nX: y")}) {
    add(url);
  }
  for (const HTTPRequest& request : refused) {
    const HTTPResponse got = exchange(request);
    EXPECT_EQ(got.status, 0) << request.url;
    EXPECT_NE(codeOf(got), 0) << request.url;
  }
  EXPECT_EQ(server.connections(), 0);
}

TEST_P(OverHTTP, TwoHundredRequestsAtOnceShareSixtyFourConnectionsThatCloseAfterwards) {
  std::latch allAtOnce(kConnections);
  std::latch allClosed(kConnections);
  const ScriptedServer server([&](Peer& peer) {
    allAtOnce.arrive_and_wait();
    echo(peer);
    allClosed.count_down();
  });
  std::map<std::string, std::future<HTTPResponse>> replies;
  for (int i = 0; i < 200; ++i) {
    const std::string path = "/" + std::to_string(i);
    replies[path] = start(get(server.url(path)));
  }
  for (auto& [path, reply] : replies) EXPECT_THAT(*reply.get().body, HasSubstr("GET " + path + " "));
  EXPECT_EQ(server.mostConnectionsAtOnce(), kConnections);
  allClosed.wait();
}

TEST_P(OverHTTP, WhatWasNotSentGoesAgainOnceAndWhatWasSentNever) {
  std::latch allCame(50);
  std::atomic<int> came{0};
  const ScriptedServer busy(
      [&](Peer&) {
        if (++came <= 50) allCame.arrive_and_wait();
      },
      "http");
  std::vector<std::future<HTTPResponse>> replies;
  for (int i = 0; i < 50; ++i) replies.push_back(start(get("https://" + busy.host())));
  for (auto& reply : replies) EXPECT_EQ(codeOf(reply.get()), kNoHandshake);
  EXPECT_EQ(busy.connections(), 100);

  // On a new connection, on a kept-alive one, and on a kept-alive one beside another.
  for (const int answered : {0, 1, 2}) {
    for (const bool isPost : {false, true}) {
      std::latch allAtOnce(answered);
      std::atomic<int> requests{0};
      const ScriptedServer server([&](Peer& peer) {
        while (!peer.request().empty() && ++requests <= answered) {
          allAtOnce.arrive_and_wait();
          peer.write(response("200 OK", ""));
        }
      });
      std::vector<std::future<HTTPResponse>> kept;
      for (int i = 0; i < answered; ++i) kept.push_back(start(get(server.url())));
      for (auto& reply : kept) EXPECT_EQ(reply.get().status, 200);
      EXPECT_EQ(codeOf(exchange(isPost ? post(server.url(), "{}") : get(server.url()))), kNoAnswer);
      EXPECT_EQ(requests, answered + 1) << isPost;
      EXPECT_EQ(server.connections(), std::max(answered, 1));
    }
  }
}

TEST_P(OverHTTP, AReplyThatBlocksHoldsUpNobody) {
  const ScriptedServer server(echo);
  std::promise<void> release;
  std::promise<std::thread::id> first;
  http().sharedSession().send(get(server.url()), [&](const HTTPResponse&) {
    release.get_future().wait();
    first.set_value(std::this_thread::get_id());
  });
  EXPECT_EQ(exchange(get(server.url())).status, 200);
  release.set_value();
  EXPECT_NE(first.get_future().get(), std::this_thread::get_id());
}

TEST_P(OverHTTP, EndingFailsWhatIsPendingAndWhatComesLater) {
  std::latch silent(1);
  const ScriptedServer server([&silent](Peer& peer) {
    peer.request();
    silent.count_down();
    keepSilent(peer);
  });
  auto pending = start(get(server.url()));
  silent.wait();
  http().beginEnding();
  EXPECT_EQ(codeOf(pending.get()), kAborted);
  EXPECT_EQ(codeOf(exchange(get(server.url()))), kAborted);
  const auto session = http().newUncachedSession();
  end();
  EXPECT_EQ(codeOf(start(*session, get(server.url())).get()), kAborted);
  EXPECT_EQ(server.connections(), 1);
}

}  // namespace
}  // namespace kvr::testing
