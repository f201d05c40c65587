#pragma once

#include "platform/text/URL.h"
#include "platform/value/Error.h"

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace kvr {

/// Whether the text is an HTTP token, the form of methods and header names.
bool isHTTPToken(std::string_view text);

/// Header fields in the order in which they were first set; names are case-insensitive.
class HTTPHeaders {
 public:
  using Field = std::pair<std::string, std::string>;

  /// Sets a field, replacing one of the same name; without a value, removes it.
  void set(std::string_view name, std::optional<std::string> value);
  std::optional<std::string> value(std::string_view name) const;
  const std::vector<Field>& fields() const { return fields_; }

  /// Why a request cannot carry this field; nothing if it can. Refused are an invalid name, a line break or
  /// NUL in the value, and the fields by which the transport gives the message length.
  static std::optional<std::string> objectionTo(std::string_view name, std::string_view value);

 private:
  std::vector<Field> fields_;
};

struct HTTPRequest {
  std::string method = "GET";
  std::string url;
  HTTPHeaders headers;
  std::string body;
  double timeout = 60;           ///< seconds for the exchange as a whole, from sending to the last byte
  bool followsRedirects = true;  ///< up to 5, towards https or from one loopback address to another
  /// The bundle on whose behalf the request is made; handed on to a network stack that accounts by bundle.
  std::string sourceApplicationBundleID;
};

struct HTTPResponse {
  int status = 0;                   ///< 0 when there was no response
  std::optional<std::string> body;  ///< nothing when the exchange failed or the body is larger than 1 MiB
  std::optional<Error> error;       ///< why there is no body; domain "http"
};

/// Sends requests. TLS is required (TLS 1.2, certificate and host name verified) except towards a loopback
/// address. A header that `HTTPHeaders::objectionTo` refuses, or a URL that is not a web address, fails the
/// request. A request that may have been sent, even in part, is not sent again after a failure.
class HTTPSession {
 public:
  using Reply = std::function<void(HTTPResponse)>;

  virtual ~HTTPSession() = default;
  /// Returns at once; `reply` is called exactly once, on a work queue where it may block, never on the
  /// caller's thread. If the process ends first, the request fails.
  virtual void send(HTTPRequest request, Reply reply) = 0;
};

class HTTP {
 public:
  virtual ~HTTP() = default;
  /// The process-wide session: connections are kept alive and shared. Lives as long as this object.
  virtual HTTPSession& sharedSession() = 0;
  /// A session that bypasses every cache on the way to the origin server. It may be destroyed as soon as
  /// `send` has returned.
  virtual std::shared_ptr<HTTPSession> newUncachedSession() = 0;
};

}  // namespace kvr
