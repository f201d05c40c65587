#include "local/http/LocalHTTP.h"

#include "local/http/HTTPTransfers.h"
#include "local/system/LoadedLibrary.h"

#include <chrono>
#include <condition_variable>
#include <mutex>
#include <utility>

namespace kvr {
namespace {

// libcurl's error codes, for requests that are refused before libcurl is loaded.
constexpr int kUnsupportedProtocol = 1;
constexpr int kFailedInitialisation = 2;
constexpr int kMalformedURL = 3;
constexpr int kAborted = 42;
constexpr int kBadArgument = 43;

Error failure(int code, std::string message) { return {"http", code, std::move(message)}; }

/// The reason why a request must not be sent, if there is one.
std::optional<Error> faultOf(const HTTPRequest& request) {
  const auto url = URL::parse(request.url);
  if (!url) return failure(kMalformedURL, "malformed URL");
  if (!url->isWeb()) return failure(kUnsupportedProtocol, "not a web address");
  if (url->scheme() == "http" && !url->isLoopback()) {
    return failure(kUnsupportedProtocol, "TLS is required except towards a loopback address");
  }
  if (!isHTTPToken(request.method)) return failure(kBadArgument, "invalid method");
  for (const auto& [name, value] : request.headers.fields()) {
    if (auto objection = HTTPHeaders::objectionTo(name, value)) {
      return failure(kBadArgument, *std::move(objection));
    }
  }
  return std::nullopt;
}

}  // namespace

/// Counts the requests without an answer or whose answer is being handled.
class LocalHTTP::OpenRequests {
 public:
  void begin() {
    const std::lock_guard lock(mutex_);
    ++count_;
  }
  void end() {
    const std::lock_guard lock(mutex_);
    if (--count_ == 0) none_.notify_all();
  }
  std::size_t count() const {
    const std::lock_guard lock(mutex_);
    return count_;
  }
  bool waitForNone(double limit) {
    std::unique_lock lock(mutex_);
    return none_.wait_for(lock, std::chrono::duration<double>(limit), [this] { return count_ == 0; });
  }

 private:
  mutable std::mutex mutex_;
  std::condition_variable none_;
  std::size_t count_ = 0;
};

/// Sends for all sessions; lives as long as any of them.
class LocalHTTP::Transport {
 public:
  using Transfers = std::shared_ptr<HTTPTransfers>;

  Transport(WorkQueues& queues, Log& log) : queues_(queues), log_(log) {}

  void send(HTTPRequest request, HTTPSession::Reply reply) {
    // The request counts until its reply has been handled and destroyed.
    openRequests_->begin();
    const std::shared_ptr<void> counted(nullptr, [open = openRequests_](void*) { open->end(); });
    HTTPTransfers::Done done = [queue = queues_.concurrentQueue(Priority::Default), counted,
                                reply = std::move(reply)](HTTPResponse response) mutable {
      queue->async([counted, reply = std::move(reply), response = std::move(response)]() mutable {
        reply(std::move(response));
      });
    };
    if (auto fault = faultOf(request)) return done({0, std::nullopt, std::move(fault)});
    const auto transfers = this->transfers();
    if (!transfers) return done({0, std::nullopt, transfers.error()});
    (*transfers)->start(std::move(request), std::move(done));
  }

  OpenRequests& openRequests() const { return *openRequests_; }

  void beginEnding() {
    Transfers transfers;
    {
      const std::lock_guard lock(mutex_);
      ending_ = true;
      transfers = transfers_;
    }
    if (transfers) transfers->beginEnding();
  }

  /// Calls `beginEnding` and waits until nothing is under way.
  void end() {
    beginEnding();
    Transfers last;
    const std::lock_guard lock(mutex_);
    last.swap(transfers_);
  }

 private:
  Result<Transfers> transfers() {
    const std::lock_guard lock(mutex_);
    if (ending_) return failure(kAborted, "the process is ending");
    if (transfers_) return transfers_;
    if (!fault_) {
      if (const auto symbol = loadSymbol(kHTTPModuleFile, kNewHTTPTransfersSymbol)) {
        transfers_.reset(reinterpret_cast<NewHTTPTransfers>(*symbol)());
        if (transfers_) return transfers_;
        fault_ = failure(kFailedInitialisation, "no transfers can be started");
      } else {
        fault_ = failure(kFailedInitialisation, symbol.error().message);
      }
      log_.error("HTTP is not available: %@", *fault_);
    }
    return *fault_;
  }

  WorkQueues& queues_;
  Log& log_;
  const std::shared_ptr<OpenRequests> openRequests_ = std::make_shared<OpenRequests>();
  std::mutex mutex_;  ///< guards what follows
  Transfers transfers_;
  std::optional<Error> fault_;  ///< why the transfers could not be started, once that has failed
  bool ending_ = false;
};

class LocalHTTP::Session : public HTTPSession {
 public:
  Session(std::shared_ptr<Transport> transport, bool isUncached)
      : transport_(std::move(transport)), isUncached_(isUncached) {}

  void send(HTTPRequest request, Reply reply) override {
    if (isUncached_) {
      request.headers.set("Cache-Control", "no-cache");
      request.headers.set("Pragma", "no-cache");
    }
    transport_->send(std::move(request), std::move(reply));
  }

 private:
  const std::shared_ptr<Transport> transport_;
  const bool isUncached_;
};

LocalHTTP::LocalHTTP(WorkQueues& queues, Log& log)
    : transport_(std::make_shared<Transport>(queues, log)),
      sharedSession_(std::make_unique<Session>(transport_, false)) {}

LocalHTTP::~LocalHTTP() { transport_->end(); }

HTTPSession& LocalHTTP::sharedSession() { return *sharedSession_; }

std::shared_ptr<HTTPSession> LocalHTTP::newUncachedSession() {
  return std::make_shared<Session>(transport_, true);
}

std::size_t LocalHTTP::openRequests() const { return transport_->openRequests().count(); }

void LocalHTTP::beginEnding() { transport_->beginEnding(); }

bool LocalHTTP::drain(double limit) { return transport_->openRequests().waitForNone(limit); }

}  // namespace kvr
