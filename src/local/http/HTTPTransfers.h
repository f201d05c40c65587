#pragma once

#include "platform/services/HTTP.h"

#include <functional>

namespace kvr {

/// The part of HTTP that is loaded at the first request: it carries out exchanges, many at a time, on one
/// thread of its own. The requests it is given are well-formed and for web addresses that are allowed.
class HTTPTransfers {
 public:
  /// Called exactly once an exchange, on any thread; it must only hand the response on.
  using Done = std::function<void(HTTPResponse)>;

  /// Ends, and waits until nothing of it runs any more.
  virtual ~HTTPTransfers() = default;
  /// Any thread. `request.timeout` counts from here.
  virtual void start(HTTPRequest request, Done done) = 0;
  /// Every exchange under way, and every later one, fails at once. Any thread.
  virtual void beginEnding() = 0;
};

inline constexpr char kHTTPModuleFile[] = "libkvragent-http.so";
inline constexpr char kNewHTTPTransfersSymbol[] = "kvrNewHTTPTransfers";
/// The caller owns the result; null when it could not be made.
using NewHTTPTransfers = HTTPTransfers* (*)();

}  // namespace kvr
