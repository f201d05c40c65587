#pragma once

#include "kvr-simulate/Dice.h"
#include "platform/services/HTTP.h"
#include "platform/value/Date.h"
#include "platform/value/Value.h"

#include <map>
#include <optional>
#include <string>
#include <vector>

namespace kvr::simulate {

/// What the service says of one device from some day on. Its label is its own, so that whatever the agent
/// shows tells from which one it was made.
struct Offer {
  std::string serialNumber;
  bool isOffered = false;
  Value::Dictionary epochs;  ///< the dates as they are sent, by key
  double daysBeforeEnd = 0;
  bool isCovered = false;
  double lastServed = -1;  ///< seconds since birth

  std::optional<Date> end() const;
  std::optional<Date> displayed() const;
  /// From when it may be posted to a device activated at `activation`.
  std::optional<Date> postDate(std::optional<Date> activation) const;
  bool isOpen(Date now) const { return isOffered && end() > now; }
};

/// The coverage service as it is during one life, with its faults.
class Service {
 public:
  enum class Fault { None, Refuses, Breaks, Late, Never, Garbage, Null, Giant, Deep, Other, Unreachable };
  struct Outcome {
    std::optional<HTTPResponse> response;  ///< none: never
    double delay = 0;                      ///< seconds
    std::optional<std::size_t> offer;      ///< the one answered, if the answer is one
  };

  explicit Service(std::uint64_t seed) : dice_(seed) {}

  /// Puts a new offer in the place of the device's present one.
  std::size_t publish(Offer offer);
  /// The device's present offer; one without anything for a device that is not known.
  std::size_t currentOf(const std::string& serialNumber);
  /// Whether each of a device's offers that was answered since `time` is open.
  bool areOpen(const std::string& serialNumber, double time, Date now) const;
  /// The offer of that label.
  Offer* find(const Value& label);
  Offer& at(std::size_t number) { return offers_[number]; }
  static Value labelOf(std::size_t number) { return "Offer " + std::to_string(number); }
  Value treeOf(std::size_t number) const;

  Outcome answerVersions();
  Outcome answerCoverage(const HTTPRequest& request);

  Fault coverageFault = Fault::None;
  Fault versionFault = Fault::None;
  double faultShare = 1;  ///< how many of the requests a fault strikes
  std::string validToken = "token 0";

 private:
  Outcome fail(Fault fault);

  Dice dice_;
  std::vector<Offer> offers_;
  std::map<std::string, std::size_t> current_;
};

}  // namespace kvr::simulate
