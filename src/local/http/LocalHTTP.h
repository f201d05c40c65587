#pragma once

#include "platform/log/Log.h"
#include "platform/services/HTTP.h"
#include "platform/services/WorkQueues.h"

#include <memory>

namespace kvr {

/// HTTP/1.1 over the network, by a library that is loaded at the first request.
///
/// At most 64 connections to a host, or 6 while the service turns others away; requests beyond them wait.
/// Connections are kept alive, and closed after 5 s without a request. Plain http is for loopback addresses
/// only. The proxies that the environment names are used, except towards a loopback address. Replies arrive
/// on the concurrent queue of default priority. Errors bear libcurl's codes.
class LocalHTTP : public HTTP {
 public:
  LocalHTTP(WorkQueues& queues, Log& log);
  /// Ends as `beginEnding` does, and waits until nothing is under way.
  ~LocalHTTP() override;
  LocalHTTP(const LocalHTTP&) = delete;
  LocalHTTP& operator=(const LocalHTTP&) = delete;

  HTTPSession& sharedSession() override;
  std::shared_ptr<HTTPSession> newUncachedSession() override;

  /// Requests that have no answer yet, or one that is being handled. Any thread.
  std::size_t openRequests() const;
  /// Every request under way, and every later one, fails at once. Any thread.
  void beginEnding();
  /// Waits until every request has been answered and its answer handled; false when that takes more than
  /// `limit` seconds.
  bool drain(double limit);

 private:
  class OpenRequests;
  class Transport;
  class Session;
  std::shared_ptr<Transport> transport_;
  std::unique_ptr<Session> sharedSession_;
};

}  // namespace kvr
