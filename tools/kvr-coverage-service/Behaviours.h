#pragma once

#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kvr::coverage_service {

/// How an answer is to differ from the plain one.
struct Behaviour {
  enum class Body { Plain, Garbage, Truncated, Oversize };
  enum class End { Close, Reset, Hold };

  std::optional<int> status;
  std::optional<std::string> redirect;  ///< the location
  Body body = Body::Plain;
  double late = 0;  ///< seconds
  bool never = false;
  std::optional<std::string> raw;  ///< what is sent in place of an answer
  std::string repeat;              ///< and then again and again
  double pace = 0;                 ///< seconds between two of these
  End end = End::Close;
};

/// The rules by which answers misbehave, per endpoint, set while the service runs. Thread-safe.
class Behaviours {
 public:
  /// Replaces the rules of each endpoint that `document` names:
  /// `{"coverage": [RULE...], "asset": [RULE...]}`, see `kHelp`. On an error nothing is changed.
  std::optional<Error> set(const Value& document);
  /// What the next request is to meet: the first rule of the endpoint that fits. Counts it.
  Behaviour next(std::string_view endpoint, const std::optional<std::string>& serialNumber);

  static const char* const kHelp;

 private:
  struct Rule {
    Behaviour behaviour;
    std::optional<std::string> serialNumber;
    std::int64_t times = -1;  ///< still to come; no end when negative
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
