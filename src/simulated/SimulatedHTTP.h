#pragma once

#include "platform/services/Clock.h"
#include "platform/services/HTTP.h"
#include "platform/services/WorkQueues.h"

#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// A network with scripted answers, in virtual time.
///
/// Each request takes the next scripted response. When none is left it goes to `handler`, and without a
/// handler it fails. Replies arrive on the concurrent queue. A request that is not answered within its own
/// timeout fails then, and a later answer is dropped.
class SimulatedHTTP : public HTTP {
 public:
  using Answer = std::function<void(HTTPResponse)>;
  using Handler = std::function<void(const HTTPRequest& request, bool uncached, Answer answer)>;

  struct Sent {
    HTTPRequest request;
    bool uncached;
    Date when;
  };

  SimulatedHTTP(WorkQueues& queues, const Clock& clock);
  ~SimulatedHTTP() override;

  HTTPSession& sharedSession() override;
  std::shared_ptr<HTTPSession> newUncachedSession() override;

  /// Called inside `send`; may answer at once or keep `answer` for later.
  Handler handler;
  /// Scripts the response to the next request without one, given `delay` seconds after it is sent.
  void respond(int status, std::string body, double delay = 0);
  void fail(Error error, double delay = 0);
  /// Scripts that the next request without a response is never answered.
  void ignore();

  /// Every request so far, in the order sent.
  const std::vector<Sent>& requests() const { return requests_; }
  void clearRequests() { requests_.clear(); }

 private:
  class Session;
  struct Scripted {
    std::optional<HTTPResponse> response;
    double delay;
  };

  void send(const HTTPRequest& request, bool uncached, HTTPSession::Reply reply);

  WorkQueues& queues_;
  const Clock& clock_;
  const std::shared_ptr<HTTPSession> shared_;
  std::deque<Scripted> script_;
  std::vector<Sent> requests_;
};

}  // namespace kvr
