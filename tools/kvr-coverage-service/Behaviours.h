#pragma once

#include "platform/value/Error.h"
#include "platform/value/Value.h"
#include "tls/Authority.h"
#include "tls/Stream.h"

#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kvr::coverage_service {

/// How an answer differs from the normal one.
struct Behaviour {
  enum class Body { Plain, Garbage, Truncated, Oversize };
  enum class End { Close, Reset, Hold };

  std::optional<int> status;
  std::optional<std::string> redirect;  ///< the location to redirect to
  Body body = Body::Plain;
  double late = 0;  ///< delay in seconds
  bool never = false;
  std::optional<std::string> raw;  ///< bytes to send instead of an answer
  std::string repeat;              ///< sent again and again after it
  double pace = 0;                 ///< seconds between two repetitions
  End end = End::Close;
  tls::Flaw flaw = tls::Flaw::None;  ///< of the connection's certificate
  int newestTLS = TLS1_3_VERSION;
};

/// The rules for misbehaving answers, per endpoint; they can be set while the service runs. Thread-safe.
class Behaviours {
 public:
  /// Replaces the rules of each endpoint in `document`, `{"coverage": [RULE...], …}`, see `kHelp`. On an
  /// error nothing changes.
  std::optional<Error> set(const Value& document);
  /// The behaviour for the next request: the first matching rule of the endpoint. Counts the request.
  Behaviour next(std::string_view endpoint, const std::optional<std::string>& serialNumber);

  static const char* const kHelp;

 private:
  struct Rule {
    Behaviour behaviour;
    std::optional<std::string> serialNumber;
    std::int64_t times = -1;  ///< how often it still applies; negative: without end
    std::int64_t every = 1;
    std::int64_t seen = 0;
  };
  using Rules = std::vector<Rule>;

  static Result<Rule> ruleOf(const Value& document);
  static std::optional<std::string> takeMember(Rule& rule, const std::string& name, const Value& value);

  std::mutex mutex_;  ///< guards what follows
  std::map<std::string, Rules, std::less<>> rules_;
};

}  // namespace kvr::coverage_service
