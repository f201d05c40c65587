#pragma once

#include "core/devices/KVRDeviceInfo.h"
#include "core/warranty/DownloadCompletion.h"
#include "core/warranty/KVRWarranty.h"

#include <cstdint>
#include <optional>
#include <string>

namespace kvr {

/// Where an agent learns about warranties and hands on what follows from them. Any thread.
class KVRAgentWarrantyProvider {
 public:
  virtual ~KVRAgentWarrantyProvider() = default;

  /// Brings the follow-ups of all devices up to date; returns the devices whose follow-ups are shown after
  /// it.
  virtual KVRDeviceInfoList refreshFollowupWithDeviceInfos(const KVRDeviceInfoList& deviceInfos) = 0;
  virtual KVRDeviceInfoList refreshFollowupWithDeviceInfo(const KVRDeviceInfoRef& deviceInfo) = 0;
  virtual void dismissFollowUpForSerialNumber(const std::string& serialNumber) = 0;
  /// Answers once, on any thread.
  virtual void downloadWarrantyForSerialNumber(const std::string& serialNumber,
                                               DownloadCompletion completionHandler) = 0;
  virtual KVRWarrantyRef cachedWarrantyForSerialNumber(const std::string& serialNumber) = 0;
  /// When the cached warranty was downloaded.
  virtual std::optional<Date> lastUpdatedDateForSerialNumber(const std::string& serialNumber) = 0;
  /// The format of the cached warranty: a string unless somebody else has stored what is none.
  virtual Value cachedWarrantyVersionForSerialNumber(const std::string& serialNumber) = 0;
  /// The locale that the cached warranty was fetched for; likewise.
  virtual Value cachedWarrantyLocaleForSerialNumber(const std::string& serialNumber) = 0;
  virtual KVRWarrantyRef migrateLegacyCachedWarrantyIfNeededForSerialNumber(
      const std::string& serialNumber) = 0;
  virtual void migrateLegacyFollowUpIfNeededWithDeviceInfo(const KVRDeviceInfoRef& deviceInfo) = 0;
  /// How long a cached warranty counts as fresh, in seconds.
  virtual double cachedWarrantyValidityDuration() = 0;
  /// Whether a primary cloud account is present.
  virtual bool isSignedInToNimbra() = 0;
  virtual std::int32_t migrationVersion() = 0;
  virtual void setMigrationVersion(std::int32_t version) = 0;
};

}  // namespace kvr
