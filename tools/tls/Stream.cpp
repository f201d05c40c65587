#include "tls/Stream.h"

#include <pthread.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <csignal>
#include <utility>

namespace kvr::tls {
namespace {

/// How long a client may keep the handshake waiting; 0 for ever.
void limitReading(int socket, time_t seconds) {
  const timeval limit{seconds, 0};
  setsockopt(socket, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
}

void takeNoBrokenPipe() {
  sigset_t brokenPipe;
  sigemptyset(&brokenPipe);
  sigaddset(&brokenPipe, SIGPIPE);
  pthread_sigmask(SIG_BLOCK, &brokenPipe, nullptr);
}

}  // namespace

std::unique_ptr<Stream> Stream::accept(int socket, const CertifiedKey& identity, int newest) {
  constexpr time_t kHandshakeSeconds = 10;
  takeNoBrokenPipe();
  const openssl::Handle<SSL_CTX, SSL_CTX_free> context(SSL_CTX_new(TLS_server_method()));
  if (!context) return nullptr;
  // The old versions need algorithms that are not offered at a higher level.
  SSL_CTX_set_security_level(context.get(), 0);
  SSL_CTX_set_min_proto_version(context.get(), TLS1_VERSION);
  SSL_CTX_set_max_proto_version(context.get(), newest);
  if (SSL_CTX_use_certificate(context.get(), identity.certificate.get()) != 1 ||
      SSL_CTX_use_PrivateKey(context.get(), identity.key.get()) != 1) {
    return nullptr;
  }
  Handle ssl(SSL_new(context.get()));
  if (!ssl || SSL_set_fd(ssl.get(), socket) != 1) return nullptr;
  limitReading(socket, kHandshakeSeconds);
  const bool isDone = SSL_accept(ssl.get()) == 1;
  limitReading(socket, 0);
  ERR_clear_error();
  return isDone ? std::unique_ptr<Stream>(new Stream(std::move(ssl))) : nullptr;
}

Stream::~Stream() {
  if (!isBroken_) SSL_shutdown(ssl_.get());
  ERR_clear_error();
}

ssize_t Stream::read(char* bytes, std::size_t size) {
  std::size_t count = 0;
  if (SSL_read_ex(ssl_.get(), bytes, size, &count) == 1) return static_cast<ssize_t>(count);
  isBroken_ = SSL_get_error(ssl_.get(), 0) != SSL_ERROR_ZERO_RETURN;
  ERR_clear_error();
  return 0;
}

bool Stream::write(std::string_view bytes) {
  std::size_t count = 0;
  isBroken_ =
      isBroken_ || (!bytes.empty() && SSL_write_ex(ssl_.get(), bytes.data(), bytes.size(), &count) != 1);
  ERR_clear_error();
  return !isBroken_;
}

}  // namespace kvr::tls
