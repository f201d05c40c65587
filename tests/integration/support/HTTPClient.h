#pragma once

#include "local/http/LocalHTTP.h"
#include "local/loop/EventLoop.h"
#include "local/loop/LocalWorkQueues.h"
#include "simulated/SimulatedLog.h"

#include <future>
#include <memory>
#include <utility>

namespace kvr::testing {

/// The agent's HTTP with everything it needs; answers are futures.
class HTTPClient {
 public:
  std::future<HTTPResponse> start(HTTPRequest request) {
    return start(http_->sharedSession(), std::move(request));
  }
  static std::future<HTTPResponse> start(HTTPSession& session, HTTPRequest request) {
    auto promise = std::make_shared<std::promise<HTTPResponse>>();
    auto future = promise->get_future();
    // A second reply would throw.
    session.send(std::move(request), [promise](HTTPResponse reply) { promise->set_value(std::move(reply)); });
    return future;
  }
  HTTPResponse exchange(HTTPRequest request) { return start(std::move(request)).get(); }
  LocalHTTP& http() { return *http_; }
  void end() { http_.reset(); }

 private:
  SimulatedLog log_;
  EventLoop loop_;
  LocalWorkQueues queues_{loop_, log_};
  std::unique_ptr<LocalHTTP> http_ = std::make_unique<LocalHTTP>(queues_, log_);
};

}  // namespace kvr::testing
