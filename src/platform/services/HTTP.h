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

/// Whether the text is a token, which methods and header names are.
bool isHTTPToken(std::string_view text);

/// Header fields in the order in which they were first set; names compare without regard to case.
class HTTPHeaders {
 public:
  using Field = std::pair<std::string, std::string>;

  /// Sets a field, in the place of one of the same name if there is one; no value takes such a field away.
  void set(std::string_view name, std::optional<std::string> value);
  std::optional<std::string> value(std::string_view name) const;
  const std::vector<Field>& fields() const { return fields_; }

  /// Why no request can carry such a field, if so: no name of a header, a line break or NUL in the value, or
  /// a field with which the transport says where the message ends.
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
/// address. A header that no request can carry (`HTTPHeaders::objectionTo`), or a URL that is no web address,
/// fails the request. Of a request that may have been sent, in part even, a failure is final: nobody sends it
/// again.
class HTTPSession {
 public:
  using Reply = std::function<void(HTTPResponse)>;

  virtual ~HTTPSession() = default;
  /// Returns at once; `reply` is called exactly once, on a work queue where it may block, never on the
  /// caller's thread. When the process ends first, it fails.
  virtual void send(HTTPRequest request, Reply reply) = 0;
};

class HTTP {
 public:
  virtual ~HTTP() = default;
  /// The process-wide session: connections are kept alive and shared. Lives as long as this.
  virtual HTTPSession& sharedSession() = 0;
  /// A session whose answers come from the origin, past every cache on the way. It may go as soon as its
  /// requests are sent.
  virtual std::shared_ptr<HTTPSession> newUncachedSession() = 0;
};

}  // namespace kvr
