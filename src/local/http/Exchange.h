#pragma once

#include "local/http/HTTPTransfers.h"
#include "local/system/Deadline.h"
#include "platform/services/HTTP.h"

#include <curl/curl.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <cmath>
#include <cstring>
#include <memory>
#include <new>
#include <stdexcept>
#include <utility>

namespace kvr::http_module {

template <auto kFree>
struct Freeing {
  template <class T>
  void operator()(T* handle) const {
    kFree(handle);
  }
};
using EasyHandle = std::unique_ptr<CURL, Freeing<curl_easy_cleanup>>;
using MultiHandle = std::unique_ptr<CURLM, Freeing<curl_multi_cleanup>>;
using HeaderList = std::unique_ptr<curl_slist, Freeing<curl_slist_free_all>>;

using Clock = std::chrono::steady_clock;

inline constexpr std::size_t kMaximumBody = std::size_t{1} << 20;
inline constexpr std::size_t kMaximumHeaders = std::size_t{256} << 10;
inline constexpr int kMaximumRedirects = 5;
inline constexpr char kBrokenConnection[] = "the connection broke when the request had been sent";

inline Error failure(CURLcode code, std::string message) { return {"http", code, std::move(message)}; }

inline bool isLoopback(const sockaddr& address) {
  if (address.sa_family == AF_INET) {
    sockaddr_in ip{};
    std::memcpy(&ip, &address, sizeof ip);
    return ntohl(ip.sin_addr.s_addr) >> 24 == 127;
  }
  if (address.sa_family == AF_INET6) {
    sockaddr_in6 ip{};
    std::memcpy(&ip, &address, sizeof ip);
    return IN6_IS_ADDR_LOOPBACK(&ip.sin6_addr);
  }
  return false;
}

/// Whether a hop that failed in this way may have been refused for lack of resources: by a server with too
/// many connections, or by this process, which has no descriptor left.
inline bool mayBeTurnedAway(CURLcode code) {
  return code == CURLE_COULDNT_CONNECT || code == CURLE_SSL_CONNECT_ERROR || code == CURLE_GOT_NOTHING ||
         code == CURLE_SEND_ERROR || code == CURLE_RECV_ERROR;
}

inline bool isRedirect(long status) {
  return status == 301 || status == 302 || status == 303 || status == 307 || status == 308;
}

/// One request and its state; following redirects takes several hops.
class Exchange {
 public:
  Exchange(HTTPRequest request, HTTPTransfers::Done done)
      : request_(std::move(request)), done_(std::move(done)), deadline_(deadlineAfter(request_.timeout)) {}
  Exchange(const Exchange&) = delete;
  Exchange& operator=(const Exchange&) = delete;
  /// Fails the exchange if it has not been answered.
  ~Exchange() {
    try {
      fail(CURLE_OUT_OF_MEMORY, "given up");
    } catch (...) {  // NOLINT(bugprone-empty-catch): there is nobody left to tell
    }
  }

  Clock::time_point deadline() const { return deadline_; }
  CURL* handle() const { return handle_.get(); }

  /// Sets the handle up for the next hop. Throws when memory is short.
  void prepare();
  /// Handles the end of a hop. True when another hop follows; otherwise the exchange has been answered.
  bool goOn(CURLcode code);
  /// Whether a refused hop may be repeated: once only, and only if nothing of the request was sent.
  bool takeSecondTry();
  void fail(CURLcode code, std::string message) {
    answer({0, std::nullopt, failure(code, std::move(message))});
  }

 private:
  // Callbacks for libcurl.
  static std::size_t takeBody(char* bytes, std::size_t one, std::size_t size, void* exchange) noexcept;
  static std::size_t takeHeader(char* bytes, std::size_t one, std::size_t size, void* exchange) noexcept;
  static curl_socket_t openSocket(void* exchange, curlsocktype purpose, curl_sockaddr* address) noexcept;
  static int beginRequest(void* exchange, char*, char*, int, int) noexcept;

  template <class T>
  void set(CURLoption option, T value) {
    const CURLcode code = curl_easy_setopt(handle_.get(), option, value);
    if (code == CURLE_OUT_OF_MEMORY) throw std::bad_alloc();
    if (code != CURLE_OK) throw std::runtime_error(curl_easy_strerror(code));
  }
  void setSafety();
  /// Whether any byte of the hop's request has been written to a connection.
  bool isSent() const { return writtenBefore_ && bytesWritten() > *writtenBefore_; }
  long bytesWritten() const;
  bool mayGoTo(const URL& target) const;
  void setMessage();
  void setHeaders();
  void follow(long status, const char* location);
  void answer(HTTPResponse response) {
    if (const auto done = std::exchange(done_, nullptr)) done(std::move(response));
  }

  HTTPRequest request_;
  HTTPTransfers::Done done_;
  const Clock::time_point deadline_;
  EasyHandle handle_;
  HeaderList headers_;
  URL url_;
  int redirects_ = 0;
  bool hadSecondTry_ = false;
  std::string body_;
  std::optional<long> writtenBefore_;  ///< bytes written (to a proxy) before the request; set at its start
  std::size_t headerBytes_ = 0;
  std::optional<Error> refusal_;  ///< why this side ended the hop
  bool isBodyTooLarge_ = false;
  std::array<char, CURL_ERROR_SIZE> errorText_{};
};

inline void Exchange::prepare() {
  if (!handle_) handle_.reset(curl_easy_init());
  if (!handle_) throw std::bad_alloc();
  curl_easy_reset(handle_.get());
  url_ = URL::parse(request_.url).value();
  body_.clear();
  writtenBefore_.reset();
  headerBytes_ = 0;
  errorText_.front() = '\0';

  set(CURLOPT_ERRORBUFFER, errorText_.data());
  set(CURLOPT_PRIVATE, static_cast<void*>(this));
  set(CURLOPT_WRITEFUNCTION, takeBody);
  set(CURLOPT_WRITEDATA, static_cast<void*>(this));
  set(CURLOPT_HEADERFUNCTION, takeHeader);
  set(CURLOPT_HEADERDATA, static_cast<void*>(this));
  setSafety();
  setMessage();
  setHeaders();
}

inline void Exchange::setSafety() {
  set(CURLOPT_NOSIGNAL, 1L);
  // Cleaning up does not wait for a name server that hangs.
  set(CURLOPT_QUICK_EXIT, 1L);
  set(CURLOPT_PROTOCOLS_STR, url_.scheme().c_str());
  set(CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
  set(CURLOPT_SSL_VERIFYPEER, 1L);
  set(CURLOPT_SSL_VERIFYHOST, 2L);
  set(CURLOPT_OPENSOCKETFUNCTION, openSocket);
  set(CURLOPT_OPENSOCKETDATA, static_cast<void*>(this));
  set(CURLOPT_PREREQFUNCTION, beginRequest);
  set(CURLOPT_PREREQDATA, static_cast<void*>(this));
  if (url_.isLoopback()) set(CURLOPT_PROXY, "");
}

inline void Exchange::setMessage() {
  set(CURLOPT_URL, request_.url.c_str());
  set(CURLOPT_PATH_AS_IS, 1L);
  set(CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
  const std::string& method = request_.method;
  if (method == "HEAD") {
    set(CURLOPT_NOBODY, 1L);
  } else if (method == "POST" || !request_.body.empty()) {
    set(CURLOPT_POST, 1L);
    set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(request_.body.size()));
    set(CURLOPT_POSTFIELDS, request_.body.data());
  }
  if (method != "HEAD" && method != "POST" && method != "GET") set(CURLOPT_CUSTOMREQUEST, method.c_str());
  if (method == "GET" && !request_.body.empty()) set(CURLOPT_CUSTOMREQUEST, "GET");
}

inline void Exchange::setHeaders() {
  headers_.reset();
  const auto append = [this](const std::string& line) {
    curl_slist* const longer = curl_slist_append(headers_.get(), line.c_str());
    if (longer == nullptr) throw std::bad_alloc();
    static_cast<void>(headers_.release());
    headers_.reset(longer);
  };
  // A name and a colon without a value remove one of libcurl's own headers.
  for (const auto* unasked : {"Accept", "Content-Type", "Expect"}) {
    if (!request_.headers.value(unasked)) append(std::string(unasked) + ":");
  }
  for (const auto& [name, value] : request_.headers.fields()) {
    const bool isBlank = value.find_first_not_of(" \t") == std::string::npos;
    std::string line = name;
    append(isBlank ? line += ";" : line.append(": ").append(value));
  }
  set(CURLOPT_HTTPHEADER, headers_.get());
}

inline std::size_t Exchange::takeBody(char* bytes, std::size_t, std::size_t size, void* exchange) noexcept {
  auto& self = *static_cast<Exchange*>(exchange);
  try {
    if (size > kMaximumBody - self.body_.size()) {
      self.isBodyTooLarge_ = true;
      self.refusal_ = failure(CURLE_FILESIZE_EXCEEDED, "the body is larger than 1 MiB");
      return 0;
    }
    self.body_.append(bytes, size);
    return size;
  } catch (...) {
    return 0;
  }
}

inline std::size_t Exchange::takeHeader(char*, std::size_t, std::size_t size, void* exchange) noexcept {
  auto& self = *static_cast<Exchange*>(exchange);
  try {
    // Informational responses, trailers and a proxy's responses count too.
    self.headerBytes_ += size;
    if (self.headerBytes_ <= kMaximumHeaders) return size;
    self.refusal_ = failure(CURLE_FILESIZE_EXCEEDED, "the headers are larger than 256 KiB");
    return 0;
  } catch (...) {
    return 0;
  }
}

inline long Exchange::bytesWritten() const {
  long count = 0;
  curl_easy_getinfo(handle_.get(), CURLINFO_REQUEST_SIZE, &count);
  return count;
}

// When a kept-alive connection breaks before an answer, libcurl sends the request again over another one. The
// service may already have received it. So both callbacks below stop libcurl if anything was sent; a request
// of which nothing was sent may go on.

inline curl_socket_t Exchange::openSocket(void* exchange, curlsocktype, curl_sockaddr* address) noexcept {
  auto& self = *static_cast<Exchange*>(exchange);
  try {
    if (self.isSent()) {
      self.refusal_ = failure(CURLE_GOT_NOTHING, kBrokenConnection);
      return CURL_SOCKET_BAD;
    }
    self.writtenBefore_.reset();
    if (self.url_.scheme() == "http" && !isLoopback(address->addr)) {
      self.refusal_ = failure(CURLE_COULDNT_CONNECT, "a loopback name led to an address elsewhere");
      return CURL_SOCKET_BAD;
    }
    return socket(address->family, address->socktype | SOCK_CLOEXEC, address->protocol);
  } catch (...) {
    return CURL_SOCKET_BAD;
  }
}

inline int Exchange::beginRequest(void* exchange, char*, char*, int, int) noexcept {
  auto& self = *static_cast<Exchange*>(exchange);
  try {
    if (self.isSent()) {
      self.refusal_ = failure(CURLE_GOT_NOTHING, kBrokenConnection);
      return CURL_PREREQFUNC_ABORT;
    }
    self.writtenBefore_ = self.bytesWritten();
    return CURL_PREREQFUNC_OK;
  } catch (...) {
    return CURL_PREREQFUNC_ABORT;
  }
}

/// Plain http is allowed for loopback addresses only, and no other host may redirect there.
inline bool Exchange::mayGoTo(const URL& target) const {
  return target.scheme() == "https" ||
         (target.scheme() == "http" && target.isLoopback() && url_.isLoopback());
}

inline bool Exchange::goOn(CURLcode code) {
  long status = 0;
  curl_easy_getinfo(handle_.get(), CURLINFO_RESPONSE_CODE, &status);
  if (code != CURLE_OK) {
    const std::string text = errorText_.front() != '\0' ? errorText_.data() : curl_easy_strerror(code);
    const Error error = refusal_.value_or(failure(code, text));
    answer({isBodyTooLarge_ ? static_cast<int>(status) : 0, std::nullopt, error});
    return false;
  }
  const char* location = nullptr;
  curl_easy_getinfo(handle_.get(), CURLINFO_REDIRECT_URL, &location);
  if (request_.followsRedirects && isRedirect(status) && location != nullptr) {
    const auto target = URL::parse(location);
    if (target && mayGoTo(*target) && redirects_ < kMaximumRedirects) {
      follow(status, location);
      return true;
    }
    const bool isTooFar = redirects_ >= kMaximumRedirects;
    answer({static_cast<int>(status), std::nullopt,
            isTooFar ? failure(CURLE_TOO_MANY_REDIRECTS, "too many redirects")
                     : failure(CURLE_UNSUPPORTED_PROTOCOL, "redirected to what is not https")});
    return false;
  }
  answer({static_cast<int>(status), std::move(body_), std::nullopt});
  return false;
}

inline bool Exchange::takeSecondTry() {
  return !refusal_ && !isSent() && !std::exchange(hadSecondTry_, true);
}

inline void Exchange::follow(long status, const char* location) {
  const bool leavesHost = URL::parse(location).value().host() != url_.host();
  const bool becomesGet =
      (status == 303 && request_.method != "HEAD") || (status < 303 && request_.method == "POST");
  if (leavesHost) {
    // Headers that identify the user go only to the host that was asked.
    HTTPHeaders kept;
    for (const auto* harmless : {"Accept", "Cache-Control", "Pragma", "User-Agent"}) {
      kept.set(harmless, request_.headers.value(harmless));
    }
    request_.headers = std::move(kept);
  }
  if (becomesGet) {
    request_.method = "GET";
    request_.body.clear();
  }
  request_.url = location;
  ++redirects_;
}

}  // namespace kvr::http_module
