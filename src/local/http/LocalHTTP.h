#pragma once

#include "platform/log/Log.h"
#include "platform/services/HTTP.h"
#include "platform/services/WorkQueues.h"

#include <memory>

namespace kvr {

/// HTTP/1.1 over the network, through a library that is loaded at the first request.
///
/// At most 64 connections per host; once a service has refused one of many, 6 until all is quiet. Further
/// requests wait. Connections are kept alive and closed after 5 s without a request. Plain http is allowed
/// for loopback addresses only. The proxies from the environment are used, except for loopback addresses.
/// Replies arrive on the concurrent queue of default priority. Error codes are libcurl's.
class LocalHTTP : public HTTP {
 public:
  LocalHTTP(WorkQueues& queues, Log& log);
  /// Calls `beginEnding` and waits until nothing is under way.
  ~LocalHTTP() override;
  LocalHTTP(const LocalHTTP&) = delete;
  LocalHTTP& operator=(const LocalHTTP&) = delete;

  HTTPSession& sharedSession() override;
  std::shared_ptr<HTTPSession> newUncachedSession() override;

  /// Requests without an answer yet, or whose answer is being handled. Any thread.
  std::size_t openRequests() const;
  /// Fails every request under way, and every later one at once. Any thread.
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
