#pragma once

#include "platform/services/UserLocale.h"

#include <string>

namespace kvr {

/// A locale that groups digits in threes; the test sets the fields.
class SimulatedUserLocale : public UserLocale {
 public:
  std::string identifier = "en_US";
  long offset = 0;  ///< seconds from GMT, all year round
  std::string groupingSeparator = ",";

  std::string preferredIdentifier() const override { return identifier; }
  long secondsFromGMT(Date /*date*/) const override { return offset; }
  std::string decimalString(std::uint64_t number) const override {
    std::string text = std::to_string(number);
    for (std::size_t end = text.size(); end > 3; end -= 3) text.insert(end - 3, groupingSeparator);
    return text;
  }
};

}  // namespace kvr
