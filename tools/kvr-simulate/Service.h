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

/// The service's answer about one device from some time on. Each offer has a unique label, so that everything
/// the agent shows can be traced to the offer it came from.
struct Offer {
  std::string serialNumber;
  bool isOffered = false;
  Value::Dictionary epochs;  ///< the dates as they are sent, by key
  double daysBeforeEnd = 0;
  bool isCovered = false;
  double lastServed = -1;  ///< when last sent, in seconds since birth

  std::optional<Date> end() const;
  std::optional<Date> displayed() const;
  /// When it may first be posted to a device activated at `activation`.
  std::optional<Date> postDate(std::optional<Date> activation) const;
  bool isOpen(Date now) const { return isOffered && end() > now; }
};

/// The coverage service during one life, with its faults.
class Service {
 public:
  enum class Fault { None, Refuses, Breaks, Late, Never, Garbage, Null, Giant, Deep, Other, Unreachable };
  struct Outcome {
    std::optional<HTTPResponse> response;  ///< none: the request is never answered
    double delay = 0;                      ///< seconds
    std::optional<std::size_t> offer;      ///< the offer in the answer, if there is one
  };

  explicit Service(std::uint64_t seed) : dice_(seed) {}

  /// Replaces the device's present offer.
  std::size_t publish(Offer offer);
  /// The device's present offer; an empty one for an unknown device.
  std::size_t currentOf(const std::string& serialNumber);
  /// Whether every offer of the device that was sent since `time` is open.
  bool areOpen(const std::string& serialNumber, double time, Date now) const;
  /// The offer with this label, or null.
  Offer* find(const Value& label);
  Offer& at(std::size_t number) { return offers_[number]; }
  static Value labelOf(std::size_t number) { return "Offer " + std::to_string(number); }
  Value treeOf(std::size_t number) const;

  Outcome answerVersions();
  Outcome answerCoverage(const HTTPRequest& request);

  Fault coverageFault = Fault::None;
  Fault versionFault = Fault::None;
  double faultShare = 1;  ///< the share of requests that a fault affects
  std::string validToken = "token 0";

 private:
  Outcome fail(Fault fault);

  Dice dice_;
  std::vector<Offer> offers_;
  std::map<std::string, std::size_t> current_;
};

}  // namespace kvr::simulate
