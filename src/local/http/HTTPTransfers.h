#pragma once

#include "platform/services/HTTP.h"

#include <functional>

namespace kvr {

/// The part of HTTP that is loaded at the first request. It carries out many exchanges at a time on one
/// thread of its own. Requests passed to it must be well-formed and their addresses allowed.
class HTTPTransfers {
 public:
  /// Called exactly once per exchange, on any thread; it must only hand the response on.
  using Done = std::function<void(HTTPResponse)>;

  /// Fails all exchanges and waits until nothing runs any more.
  virtual ~HTTPTransfers() = default;
  /// Any thread. `request.timeout` counts from here.
  virtual void start(HTTPRequest request, Done done) = 0;
  /// Fails every exchange under way, and every later one at once. Any thread.
  virtual void beginEnding() = 0;
};

inline constexpr char kHTTPModuleFile[] = "libkvragent-http.so";
inline constexpr char kNewHTTPTransfersSymbol[] = "kvrNewHTTPTransfers";
/// The caller owns the result; null when it could not be created.
using NewHTTPTransfers = HTTPTransfers* (*)();

}  // namespace kvr
