#pragma once

#include "core/agent/KVRAgentWarrantyProvider.h"

namespace kvr {

/// Reads cache files and preferences afresh for each call, and downloads on behalf of the client that the
/// agent serves. The only state is that client's bundle identifier.
class KVRAgentDefaultWarrantyProvider : public KVRAgentWarrantyProvider {
 public:
  KVRAgentDefaultWarrantyProvider(Platform& platform, std::string callingProcessBundleID);

  KVRDeviceInfoList refreshFollowupWithDeviceInfos(const KVRDeviceInfoList& deviceInfos) override;
  KVRDeviceInfoList refreshFollowupWithDeviceInfo(const KVRDeviceInfoRef& deviceInfo) override;
  void dismissFollowUpForSerialNumber(const std::string& serialNumber) override;
  void downloadWarrantyForSerialNumber(const std::string& serialNumber,
                                       DownloadCompletion completionHandler) override;
  KVRWarrantyRef cachedWarrantyForSerialNumber(const std::string& serialNumber) override;
  std::optional<Date> lastUpdatedDateForSerialNumber(const std::string& serialNumber) override;
  Value cachedWarrantyVersionForSerialNumber(const std::string& serialNumber) override;
  Value cachedWarrantyLocaleForSerialNumber(const std::string& serialNumber) override;
  KVRWarrantyRef migrateLegacyCachedWarrantyIfNeededForSerialNumber(const std::string& serialNumber) override;
  void migrateLegacyFollowUpIfNeededWithDeviceInfo(const KVRDeviceInfoRef& deviceInfo) override;
  double cachedWarrantyValidityDuration() override;
  bool isSignedInToNimbra() override;
  std::int32_t migrationVersion() override;
  void setMigrationVersion(std::int32_t version) override;

 private:
  Platform& platform_;
  const std::string callingProcessBundleID_;
};

}  // namespace kvr
