// One exchange over HTTP: the part of the input before the first byte FF sets the request's headers, the rest
// is the server's answer.
#include "Fuzz.h"
#include "local/http/LocalHTTP.h"
#include "local/loop/EventLoop.h"
#include "local/loop/LocalWorkQueues.h"
#include "local/system/Descriptor.h"
#include "simulated/SimulatedLog.h"

#include <arpa/inet.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>

namespace kvr::fuzz {
namespace {

/// The headers, one per line: "Name:value". A name without a value removes the header.
HTTPHeaders headersIn(std::string_view text) {
  HTTPHeaders headers;
  while (!text.empty()) {
    const auto end = std::min(text.find('\n'), text.size());
    const auto line = text.substr(0, end);
    text.remove_prefix(std::min(end + 1, text.size()));
    const auto colon = line.find(':');
    const auto name = line.substr(0, colon);
    const auto value =
        colon == std::string_view::npos ? std::nullopt : std::optional(std::string(line.substr(colon + 1)));
    headers.set(name, value);
    require(headers.value(name) == value, "a header is what it was set to");
  }
  return headers;
}

/// Waits for one of them; libFuzzer's timer signal does not end the wait.
template <std::size_t count>
bool waitFor(std::array<pollfd, count>& sources, int milliseconds) {
  int ready = 0;
  do {
    ready = ::poll(sources.data(), sources.size(), milliseconds);
  } while (ready < 0 && errno == EINTR);
  return ready > 0;
}

/// A server on this machine that answers one request with the given bytes.
class Server {
 public:
  Server() : listener_(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    address_.sin_family = AF_INET;
    address_.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t size = sizeof address_;
    auto* const address = reinterpret_cast<sockaddr*>(&address_);
    require(::bind(listener_.get(), address, size) == 0 && ::listen(listener_.get(), 16) == 0 &&
                ::getsockname(listener_.get(), address, &size) == 0,
            "a server");
  }

  std::string url() const { return "http://127.0.0.1:" + std::to_string(ntohs(address_.sin_port)) + "/"; }
  int descriptor() const { return listener_.get(); }

  /// Accepts the next connection; returns what arrived up to the end of the request's headers.
  std::string serve(std::string_view answer) const {
    const Descriptor connection(::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
    std::string request;
    std::array<char, 4096> part{};
    while (request.find("\r\n\r\n") == std::string::npos) {
      const auto count = ::recv(connection.get(), part.data(), part.size(), 0);
      if (count <= 0) return request;
      request.append(part.data(), static_cast<std::size_t>(count));
    }
    while (!answer.empty()) {
      const auto count = ::send(connection.get(), answer.data(), answer.size(), MSG_NOSIGNAL);
      if (count <= 0) break;
      answer.remove_prefix(static_cast<std::size_t>(count));
    }
    ::shutdown(connection.get(), SHUT_WR);
    // Once the client closes, or sees the connection closed, it has read all it wants.
    std::array closed{pollfd{connection.get(), POLLIN, 0}};
    if (!answer.empty()) waitFor(closed, 1000);
    return request;
  }

 private:
  const Descriptor listener_;
  sockaddr_in address_{};
};

struct Client {
  Server server;
  SimulatedLog log;
  EventLoop loop;
  LocalWorkQueues queues{loop, log};
  LocalHTTP http{queues, log};
  const Descriptor replied{::eventfd(0, EFD_CLOEXEC)};
  HTTPResponse response;

  void exchange(const HTTPHeaders& headers, std::string_view answer);
};

void Client::exchange(const HTTPHeaders& headers, std::string_view answer) {
  HTTPRequest request;
  request.url = server.url();
  request.headers = headers;
  request.timeout = 10;
  request.followsRedirects = false;
  http.sharedSession().send(request, [this](HTTPResponse given) {
    response = std::move(given);
    const std::uint64_t one = 1;
    require(::write(replied.get(), &one, sizeof one) == sizeof one, "a reply");
  });
  std::array<pollfd, 2> sources{pollfd{replied.get(), POLLIN, 0}, pollfd{server.descriptor(), POLLIN, 0}};
  while (sources[0].revents == 0) {
    require(waitFor(sources, 20'000), "an exchange comes to its end");
    if (sources[1].revents == 0) continue;
    const auto received = server.serve(answer);
    const auto end = received.find("\r\n\r\n");
    if (end == std::string::npos) continue;
    const auto lines = std::ranges::count(received.substr(0, end), '\n');
    // The request's own line is none of them; the host's is always there.
    const auto own = headers.value("Host") ? 0 : 1;
    require(lines <= static_cast<std::ptrdiff_t>(headers.fields().size()) + own, "no header becomes two",
            received);
  }
  std::uint64_t replies = 0;
  require(::read(replied.get(), &replies, sizeof replies) == sizeof replies && replies == 1, "one reply");
  constexpr std::size_t kLargestBody = 1U << 20U;
  require(response.body.has_value() != response.error.has_value(), "a body, or why there is none");
  if (response.body) {
    require(response.status >= 100 && response.status <= 999, "a status");
    require(response.body->size() <= kLargestBody && response.body->size() <= answer.size(),
            "a body that was sent");
  } else {
    require(response.error->domain == "http" && !response.error->message.empty(), "an error says what it is");
  }
}

}  // namespace

void run(std::string_view input) {
  static Client client;
  const auto separator = input.find('\xFF');
  const bool hasHeaders = separator != std::string_view::npos;
  client.exchange(hasHeaders ? headersIn(input.substr(0, separator)) : HTTPHeaders(),
                  hasHeaders ? input.substr(separator + 1) : input);
}

}  // namespace kvr::fuzz
