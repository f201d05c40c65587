#pragma once

#include "platform/value/AtomicProperty.h"
#include "platform/value/Date.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace kvr {

class KVRDevice;
using KVRDeviceRef = std::shared_ptr<const KVRDevice>;

/// One device: the phone itself, a paired watch, or a device known only by its serial number.
///
/// Two devices are equal only if they are the same object. The coded form, under fixed keys, is what clients
/// receive. Any thread.
class KVRDevice {
 public:
  static constexpr std::uint64_t kLocal = 0;
  static constexpr std::uint64_t kWatch = 1;
  static constexpr std::uint64_t kOther = 2;

  KVRDevice(std::optional<std::string> name, std::optional<std::string> serialNumber,
            std::optional<Date> activationDate, std::uint64_t deviceType);
  static std::shared_ptr<KVRDevice> deviceWithName(std::optional<std::string> name,
                                                   std::optional<std::string> serialNumber,
                                                   std::optional<Date> activationDate,
                                                   std::uint64_t deviceType);

  static constexpr bool supportsSecureCoding() { return true; }
  /// A device from its coded form; a value of the wrong kind counts as an absent property.
  static std::shared_ptr<KVRDevice> initWithCoder(const Value& coded);
  /// The coded form; an absent property has no key.
  Value encodeWithCoder() const;

  /// "Default", "Watch" or "Other".
  const char* deviceTypeString() const;
  std::string description() const;

  AtomicProperty<std::optional<std::string>> name;
  AtomicProperty<std::optional<std::string>> serialNumber;
  AtomicProperty<std::optional<Date>> activationDate;  ///< when it was activated or paired
  AtomicProperty<std::uint64_t> deviceType;
};

}  // namespace kvr
