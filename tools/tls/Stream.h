#pragma once

#include "local/keys/LocalCertificates.h"

#include <openssl/ssl.h>
#include <sys/types.h>

#include <cstddef>
#include <memory>
#include <string_view>

namespace kvr::tls {

/// The server's end of a TLS connection over a blocking socket, which must outlive it. Use it on one thread;
/// that thread gets no SIGPIPE any more.
class Stream {
 public:
  /// Whether a client that has sent this first byte speaks TLS.
  static bool beginsWith(char byte) { return byte == '\x16'; }
  /// Waits until the handshake is done; null when it fails. `newest` is the newest version of TLS that is
  /// offered.
  static std::unique_ptr<Stream> accept(int socket, const CertifiedKey& identity,
                                        int newest = TLS1_3_VERSION);
  /// Tells the client that nothing more follows.
  ~Stream();
  Stream(const Stream&) = delete;
  Stream& operator=(const Stream&) = delete;

  /// Waits for some bytes; 0 or less when the client has gone.
  ssize_t read(char* bytes, std::size_t size);
  /// Writes all of it; false when the client has gone.
  bool write(std::string_view bytes);
  /// Whether bytes have been taken from the socket that `read` has not returned yet.
  bool hasUnread() const { return SSL_has_pending(ssl_.get()) == 1; }
  /// The version of TLS, such as "TLSv1.3".
  std::string_view version() const { return SSL_get_version(ssl_.get()); }

 private:
  using Handle = openssl::Handle<SSL, SSL_free>;
  explicit Stream(Handle ssl) : ssl_(std::move(ssl)) {}

  Handle ssl_;
  bool isBroken_ = false;
};

}  // namespace kvr::tls
