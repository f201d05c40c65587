#pragma once

#include "core/devices/KVRDeviceInfo.h"
#include "core/warranty/DownloadCompletion.h"
#include "core/warranty/KVRWarranty.h"

#include <cstdint>
#include <optional>
#include <string>

namespace kvr {

/// An agent's access to warranties (cache and download) and to follow-ups. Any thread.
class KVRAgentWarrantyProvider {
 public:
  virtual ~KVRAgentWarrantyProvider() = default;

  /// Brings the follow-ups of all devices up to date; returns the devices whose follow-ups are shown
  /// afterwards.
  virtual KVRDeviceInfoList refreshFollowupWithDeviceInfos(const KVRDeviceInfoList& deviceInfos) = 0;
  virtual KVRDeviceInfoList refreshFollowupWithDeviceInfo(const KVRDeviceInfoRef& deviceInfo) = 0;
  virtual void dismissFollowUpForSerialNumber(const std::string& serialNumber) = 0;
  /// Calls `completionHandler` once, on any thread.
  virtual void downloadWarrantyForSerialNumber(const std::string& serialNumber,
                                               DownloadCompletion completionHandler) = 0;
  virtual KVRWarrantyRef cachedWarrantyForSerialNumber(const std::string& serialNumber) = 0;
  /// When the cached warranty was downloaded.
  virtual std::optional<Date> lastUpdatedDateForSerialNumber(const std::string& serialNumber) = 0;
  /// The format of the cached warranty. A string, unless another program has stored something else.
  virtual Value cachedWarrantyVersionForSerialNumber(const std::string& serialNumber) = 0;
  /// The locale that the cached warranty was fetched for. The same holds.
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
