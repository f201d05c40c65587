#pragma once

#include "platform/value/Date.h"

#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// One watch that is or was paired with this device; any property may be absent.
struct PairedDeviceEntry {
  std::optional<std::string> name;
  std::optional<std::string> localizedModel;
  std::optional<std::string> serialNumber;
  std::optional<Date> pairedDate;
  std::optional<bool> isPaired;
  std::optional<bool> isArchived;
};

std::string describe(const PairedDeviceEntry& entry);

class PairedDeviceRegistry {
 public:
  using Predicate = std::function<bool(const PairedDeviceEntry&)>;

  virtual ~PairedDeviceRegistry() = default;
  /// The entries that satisfy the predicate, archived ones and those of other accounts included, in the
  /// registry's order. Any thread.
  virtual std::vector<PairedDeviceEntry> allDevicesPassing(const Predicate& predicate) const = 0;
};

}  // namespace kvr
