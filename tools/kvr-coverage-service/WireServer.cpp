#include "WireServer.h"

#include <arpa/inet.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>

#include <algorithm>
#include <chrono>
#include <climits>
#include <condition_variable>
#include <exception>
#include <mutex>
#include <stdexcept>
#include <string_view>
#include <thread>

namespace kvr::coverage_service {
namespace {

constexpr std::size_t kMaximumConnections = 256;
constexpr std::size_t kMaximumHead = std::size_t{256} << 10;
constexpr std::size_t kMaximumPayload = std::size_t{1} << 20;
constexpr int kIdleSeconds = 60;
constexpr int kReadMilliseconds = 10'000;

/// Runs each task on a thread of its own; while too many run, whoever brings another one waits.
class ThreadPerTask : public httplib::TaskQueue {
 public:
  void enqueue(std::function<void()> task) override {
    {
      std::unique_lock lock(mutex_);
      changed_.wait(lock, [this] { return running_ < kMaximumConnections; });
      ++running_;
    }
    try {
      std::thread([this, task] {
        task();
        end();
      }).detach();
    } catch (const std::exception&) {
      task();
      end();
    }
  }
  void shutdown() override {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [this] { return running_ == 0; });
  }

 private:
  void end() {
    const std::lock_guard lock(mutex_);
    --running_;
    changed_.notify_all();
  }

  std::mutex mutex_;
  std::condition_variable changed_;
  std::size_t running_ = 0;
};

thread_local Connection* currentConnection = nullptr;

std::string_view trimmed(std::string_view text) {
  const auto begin = text.find_first_not_of(" \t");
  return begin == std::string_view::npos ? std::string_view()
                                         : text.substr(begin, text.find_last_not_of(" \t") - begin + 1);
}

void describeAddress(int (*ask)(int, sockaddr*, socklen_t*), int socket, std::string& ip, int& port) {
  sockaddr_in address{};
  socklen_t size = sizeof address;
  if (ask(socket, reinterpret_cast<sockaddr*>(&address), &size) != 0) return;
  char text[INET_ADDRSTRLEN] = {};
  inet_ntop(AF_INET, &address.sin_addr, text, sizeof text);
  ip = text;
  port = ntohs(address.sin_port);
}

}  // namespace

Connection::~Connection() {
  tls_.reset();
  shutdown(socket_.get(), SHUT_RDWR);
}

bool Connection::awaitRequest() {
  head_.clear();
  isHeadComplete_ = false;
  return !isAbandoned_ && becomesReadable(kIdleSeconds * 1000);
}

char Connection::firstByte() const {
  char byte = 0;
  static_cast<void>(recv(socket_.get(), &byte, 1, MSG_PEEK));
  return byte;
}

std::vector<HTTPHeaders::Field> Connection::headers() const {
  std::vector<HTTPHeaders::Field> fields;
  std::string_view rest(head_);
  while (true) {
    const auto end = rest.find("\r\n");
    if (end == std::string_view::npos) return fields;
    const auto line = rest.substr(0, end);
    const auto colon = line.find(':');
    const bool isFirst = rest.size() == head_.size();
    if (!isFirst && colon != std::string_view::npos) {
      fields.emplace_back(line.substr(0, colon), trimmed(line.substr(colon + 1)));
    }
    rest.remove_prefix(end + 2);
  }
}

bool Connection::wait(double seconds) const {
  using namespace std::chrono;
  constexpr double kLongest = 86'400;
  const auto end = steady_clock::now() + duration<double>(std::min(seconds, kLongest));
  while (true) {
    const auto left = ceil<milliseconds>(end - steady_clock::now()).count();
    if (seconds >= 0 && left <= 0) return true;
    pollfd watched[] = {{socket_.get(), POLLRDHUP, 0}, {stop_, POLLIN, 0}};
    const int count = poll(watched, 2, seconds < 0 ? -1 : static_cast<int>(left));
    if (count > 0 || (count < 0 && errno != EINTR)) return false;
  }
}

bool Connection::becomesReadable(int milliseconds) const {
  if (readUpTo_ < unread_.size() || (tls_ && tls_->hasUnread())) return true;
  pollfd watched[] = {{socket_.get(), POLLIN, 0}, {stop_, POLLIN, 0}};
  return poll(watched, 2, milliseconds) > 0 && watched[1].revents == 0;
}

bool Connection::is_readable() const { return becomesReadable(kReadMilliseconds); }

ssize_t Connection::read(char* bytes, std::size_t size) {
  if (readUpTo_ == unread_.size()) {
    if (!is_readable()) return -1;
    char buffer[4096];
    const auto count =
        tls_ ? tls_->read(buffer, sizeof buffer) : recv(socket_.get(), buffer, sizeof buffer, 0);
    if (count <= 0) return count;
    if (bytes_) *bytes_ += count;
    unread_.assign(buffer, static_cast<std::size_t>(count));
    readUpTo_ = 0;
  }
  const std::size_t count = unread_.copy(bytes, size, readUpTo_);
  readUpTo_ += count;
  if (!isHeadComplete_) {
    head_.append(bytes, count);
    isHeadComplete_ = head_.ends_with("\r\n\r\n");
    if (head_.size() > kMaximumHead) return -1;
  }
  return static_cast<ssize_t>(count);
}

bool Connection::send(std::string_view bytes) const {
  if (tls_) return tls_->write(bytes);
  while (!bytes.empty()) {
    const auto count = ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (count <= 0) return false;
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  return true;
}

void Connection::reset() const {
  const sockaddr nowhere{AF_UNSPEC, {}};
  static_cast<void>(connect(socket_.get(), &nowhere, sizeof nowhere));
}

ssize_t Connection::write(const char* bytes, std::size_t size) {
  if (isAbandoned_) return -1;
  if (tls_) return tls_->write({bytes, size}) ? static_cast<ssize_t>(size) : -1;
  return ::send(socket_.get(), bytes, size, MSG_NOSIGNAL);
}

void Connection::get_remote_ip_and_port(std::string& ip, int& port) const {
  describeAddress(getpeername, socket_.get(), ip, port);
}

void Connection::get_local_ip_and_port(std::string& ip, int& port) const {
  describeAddress(getsockname, socket_.get(), ip, port);
}

WireServer::WireServer() : stop_(eventfd(0, EFD_CLOEXEC)) {
  if (!stop_) throw std::runtime_error("no event descriptor");
  new_task_queue = [] { return new ThreadPerTask; };
  set_payload_max_length(kMaximumPayload);
  set_keep_alive_timeout(kIdleSeconds);
  set_keep_alive_max_count(INT_MAX);
  set_tcp_nodelay(true);
}

Connection& WireServer::connection() { return *currentConnection; }

void WireServer::stopServing() {
  eventfd_write(stop_.get(), 1);
  stop();
}

/// Waits for a new connection's first byte and encrypts the connection if the client wants it; false when it
/// comes to nothing.
bool WireServer::begin(Connection& connection) {
  if (!connection.awaitRequest()) return false;
  if (!acceptTLS_ || !tls::Stream::beginsWith(connection.firstByte())) return true;
  ++tlsCounts_.connections;
  auto stream = acceptTLS_(connection.socket());
  if (!stream) return false;
  connection.encrypt(std::move(stream), tlsCounts_.bytes);
  return true;
}

bool WireServer::process_and_close_socket(socket_t socket) {
  Connection connection(Descriptor(socket), stop_.get());
  currentConnection = &connection;
  try {
    bool isClosed = !begin(connection);
    while (!isClosed && connection.awaitRequest()) {
      if (!process_request(connection, false, isClosed, nullptr)) break;
    }
  } catch (const std::exception&) {
    connection.abandon();
  }
  currentConnection = nullptr;
  return true;
}

}  // namespace kvr::coverage_service
