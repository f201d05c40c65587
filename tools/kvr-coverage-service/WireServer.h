#pragma once

#include "local/system/Descriptor.h"
#include "platform/services/HTTP.h"
#include "tls/Stream.h"

#include <httplib.h>

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace kvr::coverage_service {

/// One client's connection.
class Connection : public httplib::Stream {
 public:
  /// `stop` becomes readable when the server stops.
  Connection(Descriptor socket, int stop) : socket_(std::move(socket)), stop_(stop) {}
  ~Connection() override;

  /// Waits for the first byte of another request; false when the client has gone or was silent for too long,
  /// or the server stops.
  bool awaitRequest();
  /// The first byte of another request that has been awaited; it remains to be read.
  char firstByte() const;
  /// Reads and writes through `tls` from now on. What is read counts as `bytes`.
  void encrypt(std::unique_ptr<tls::Stream> tls, std::atomic<std::int64_t>& bytes) {
    tls_ = std::move(tls);
    bytes_ = &bytes;
  }
  /// The version of TLS; empty without.
  std::string tlsVersion() const { return tls_ ? std::string(tls_->version()) : std::string(); }
  /// The header fields of the present request, in order.
  std::vector<HTTPHeaders::Field> headers() const;
  /// Waits for `seconds`, or without a limit if negative. False when the client goes or the server stops
  /// meanwhile.
  bool wait(double seconds) const;
  /// Writes all of it; false when the client has gone.
  bool send(std::string_view bytes) const;
  /// Resets the connection (TCP RST), without a regular close.
  void reset() const;
  /// Writes nothing more: the client sees the connection end.
  void abandon() { isAbandoned_ = true; }

  bool is_readable() const override;
  bool is_writable() const override { return !isAbandoned_; }
  ssize_t read(char* bytes, std::size_t size) override;
  ssize_t write(const char* bytes, std::size_t size) override;
  void get_remote_ip_and_port(std::string& ip, int& port) const override;
  void get_local_ip_and_port(std::string& ip, int& port) const override;
  socket_t socket() const override { return socket_.get(); }

 private:
  bool becomesReadable(int milliseconds) const;

  const Descriptor socket_;
  const int stop_;
  std::unique_ptr<tls::Stream> tls_;
  std::atomic<std::int64_t>* bytes_ = nullptr;
  std::string unread_;
  std::size_t readUpTo_ = 0;
  std::string head_;  ///< of the present request, as far as it has been read
  bool isHeadComplete_ = false;
  bool isAbandoned_ = false;
};

/// An HTTP server with one thread per connection, so that a delayed answer does not delay other clients.
class WireServer : public httplib::Server {
 public:
  /// Encrypts a new connection; null when that fails.
  using AcceptTLS = std::function<std::unique_ptr<tls::Stream>(int socket)>;
  struct TLSCounts {
    std::atomic<std::int64_t> connections{0};
    std::atomic<std::int64_t> bytes{0};  ///< received, decrypted
  };

  WireServer();

  /// Accepts TLS beside plain connections. Call it before the server runs.
  void serveTLS(AcceptTLS accept) { acceptTLS_ = std::move(accept); }
  const TLSCounts& tlsCounts() const { return tlsCounts_; }

  /// The connection of the request that the calling thread is answering.
  static Connection& connection();
  /// Ends all waits and `listen_after_bind`, if it has begun. Any thread.
  void stopServing();

 private:
  bool process_and_close_socket(socket_t socket) override;

  bool begin(Connection& connection);

  const Descriptor stop_;
  AcceptTLS acceptTLS_;
  TLSCounts tlsCounts_;
};

}  // namespace kvr::coverage_service
