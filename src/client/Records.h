#pragma once

#if __cplusplus < 202002L
#error "The kvragent client library needs C++20: compile with -std=c++20 or later."
#endif

#include "platform/value/Date.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace kvr::client {

// The agent's records as a client sees them. A property that is missing or of the wrong type is absent; it
// never makes the whole record fail.

struct Device {
  enum Type : std::uint64_t { Default = 0, Watch = 1, Other = 2 };

  std::optional<std::string> name;
  std::optional<std::string> serialNumber;
  std::optional<Date> activationDate;
  std::uint64_t deviceType = Default;  ///< may be any number

  static Device from(const Value& record);
};

/// What a warranty's dictionary tells its owner.
struct Coverage {
  bool isCovered = false;
  std::optional<std::string> label;
  std::optional<std::string> description;
  std::optional<Date> end;
  bool isOfferShown = false;  ///< whether a follow-up about the offer may be shown
  std::optional<std::string> offerLabel;
  std::optional<Date> offerFrom;  ///< from when the follow-up may be shown
  std::optional<Date> offerEnd;

  static Coverage from(const Value& warranty);
};

struct DeviceInfo {
  Device device;
  Value warranty;  ///< the warranty's dictionary; null when none is known

  static DeviceInfo from(const Value& record);
};

/// What has changed since the last one of these, by the serial numbers of the devices.
struct Change {
  /// The agent tells this client from here on, for the first time or again. Before, anything may have
  /// changed.
  bool isBeginning = false;
  std::vector<std::string> records;    ///< their coverage is another
  std::vector<std::string> followUps;  ///< their offer was posted, changed or removed
  bool devices = false;                ///< the list of devices; ask for all of them anew
};

}  // namespace kvr::client
