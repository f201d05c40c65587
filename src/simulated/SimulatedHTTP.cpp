#include "simulated/SimulatedHTTP.h"

#include <utility>

namespace kvr {

namespace {

/// A request under way. Only the first answer counts; the reply is given on the concurrent queue.
class Exchange : public std::enable_shared_from_this<Exchange> {
 public:
  Exchange(WorkQueues& queues, HTTPSession::Reply reply) : queues_(queues), reply_(std::move(reply)) {}

  void answer(HTTPResponse response) {
    if (std::exchange(answered_, true)) return;
    if (timeout_) timeout_->invalidate();
    queues_.concurrentQueue(Priority::Default)
        ->async([reply = std::exchange(reply_, nullptr), response = std::move(response)]() mutable {
          reply(std::move(response));
        });
  }
  void answerAfter(double delay, HTTPResponse response) {
    queues_.after(delay, queues_.concurrentQueue(Priority::Default),
                  [self = shared_from_this(), response = std::move(response)] { self->answer(response); });
  }
  void failAfter(double timeout, HTTPResponse response) {
    timeout_ = queues_.newRepeatingTimer(
        timeout, queues_.concurrentQueue(Priority::Default),
        [self = shared_from_this(), response = std::move(response)] { self->answer(response); });
  }

 private:
  WorkQueues& queues_;
  HTTPSession::Reply reply_;
  std::shared_ptr<Timer> timeout_;  ///< until answered
  bool answered_ = false;
};

HTTPResponse failure(Error error) { return {0, std::nullopt, std::move(error)}; }

}  // namespace

class SimulatedHTTP::Session : public HTTPSession {
 public:
  Session(SimulatedHTTP& http, bool uncached) : http_(http), uncached_(uncached) {}
  void send(HTTPRequest request, Reply reply) override { http_.send(request, uncached_, std::move(reply)); }

 private:
  SimulatedHTTP& http_;
  const bool uncached_;
};

SimulatedHTTP::SimulatedHTTP(WorkQueues& queues, const Clock& clock)
    : queues_(queues), clock_(clock), shared_(std::make_shared<Session>(*this, false)) {}

SimulatedHTTP::~SimulatedHTTP() = default;

HTTPSession& SimulatedHTTP::sharedSession() { return *shared_; }

std::shared_ptr<HTTPSession> SimulatedHTTP::newUncachedSession() {
  return std::make_shared<Session>(*this, true);
}

void SimulatedHTTP::respond(int status, std::string body, double delay) {
  script_.push_back({HTTPResponse{status, std::move(body), std::nullopt}, delay});
}

void SimulatedHTTP::fail(Error error, double delay) { script_.push_back({failure(std::move(error)), delay}); }

void SimulatedHTTP::ignore() { script_.push_back({std::nullopt, 0}); }

void SimulatedHTTP::send(const HTTPRequest& request, bool uncached, HTTPSession::Reply reply) {
  requests_.push_back({request, uncached, clock_.now()});
  const auto exchange = std::make_shared<Exchange>(queues_, std::move(reply));
  exchange->failAfter(request.timeout, failure({"http", 28, "The request timed out."}));
  if (!script_.empty()) {
    Scripted next = std::move(script_.front());
    script_.pop_front();
    if (next.response) exchange->answerAfter(next.delay, *std::move(next.response));
  } else if (handler) {
    handler(request, uncached, [exchange](HTTPResponse response) { exchange->answer(std::move(response)); });
  } else {
    exchange->answer(failure({"http", 7, "Could not connect to the server."}));
  }
}

}  // namespace kvr
