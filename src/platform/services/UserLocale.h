#pragma once

#include "platform/value/Date.h"

#include <cstdint>
#include <string>

namespace kvr {

/// The user's language, number format and time zone, read afresh by every call. Any thread.
class UserLocale {
 public:
  virtual ~UserLocale() = default;
  /// The preferred locale's identifier, such as "en_US".
  virtual std::string preferredIdentifier() const = 0;
  /// The local time zone's offset from GMT in seconds at `date`, daylight-saving time included.
  virtual long secondsFromGMT(Date date) const = 0;
  /// A whole number in the preferred locale's decimal style, grouped as that locale groups.
  virtual std::string decimalString(std::uint64_t number) const = 0;
};

}  // namespace kvr
