#include "core/agent/KVRAgentDefaultWarrantyProvider.h"

#include "core/followup/KVRFollowUp.h"
#include "core/outreach/WarrantyDownloads.h"
#include "core/warranty/CacheMetadata.h"
#include "core/warranty/WarrantyKeys.h"

#include <algorithm>
#include <limits>

namespace kvr {

KVRAgentDefaultWarrantyProvider::KVRAgentDefaultWarrantyProvider(Platform& platform,
                                                                 std::string callingProcessBundleID)
    : platform_(platform), callingProcessBundleID_(std::move(callingProcessBundleID)) {
  platform_.log.debug("%s: callingProcess=%@",
                      "-[KVRAgentDefaultWarrantyProvider initWithCallingProcessBundleID:]",
                      callingProcessBundleID_);
}

KVRDeviceInfoList KVRAgentDefaultWarrantyProvider::refreshFollowupWithDeviceInfos(
    const KVRDeviceInfoList& deviceInfos) {
  return KVRFollowUp(platform_).refreshFollowupWithDeviceInfos(deviceInfos);
}

KVRDeviceInfoList KVRAgentDefaultWarrantyProvider::refreshFollowupWithDeviceInfo(
    const KVRDeviceInfoRef& deviceInfo) {
  return KVRFollowUp(platform_).refreshFollowupWithDeviceInfo(deviceInfo, false);
}

void KVRAgentDefaultWarrantyProvider::dismissFollowUpForSerialNumber(const std::string& serialNumber) {
  KVRFollowUp(platform_).dismissFollowUpForSerialNumber(serialNumber);
}

void KVRAgentDefaultWarrantyProvider::migrateLegacyFollowUpIfNeededWithDeviceInfo(
    const KVRDeviceInfoRef& deviceInfo) {
  KVRFollowUp(platform_).migrateLegacyFollowUpIfNeededWithDeviceInfo(*deviceInfo);
}

void KVRAgentDefaultWarrantyProvider::downloadWarrantyForSerialNumber(const std::string& serialNumber,
                                                                      DownloadCompletion completionHandler) {
  const auto downloader = newWarrantyDownloader(platform_, callingProcessBundleID_);
  downloader->downloadWarrantyForSerialNumber(serialNumber, completionHandler);
}

KVRWarrantyRef KVRAgentDefaultWarrantyProvider::cachedWarrantyForSerialNumber(
    const std::string& serialNumber) {
  return KVRWarranty::cachedWarrantyForSerialNumber(platform_, serialNumber);
}

std::optional<Date> KVRAgentDefaultWarrantyProvider::lastUpdatedDateForSerialNumber(
    const std::string& serialNumber) {
  return platform_.preferences.dateForKey(CacheMetadata(serialNumber).lastUpdatedDateKey);
}

Value KVRAgentDefaultWarrantyProvider::cachedWarrantyVersionForSerialNumber(const std::string& serialNumber) {
  return platform_.preferences.objectForKey(CacheMetadata(serialNumber).versionKey);
}

Value KVRAgentDefaultWarrantyProvider::cachedWarrantyLocaleForSerialNumber(const std::string& serialNumber) {
  return platform_.preferences.objectForKey(CacheMetadata(serialNumber).localeKey);
}

KVRWarrantyRef KVRAgentDefaultWarrantyProvider::migrateLegacyCachedWarrantyIfNeededForSerialNumber(
    const std::string& serialNumber) {
  return KVRWarranty::migrateLegacyCachedWarrantyIfNeededForSerialNumber(platform_, serialNumber);
}

double KVRAgentDefaultWarrantyProvider::cachedWarrantyValidityDuration() {
  return platform_.preferences.doubleForKey(preference::kCachedWarrantyValidityDuration);
}

bool KVRAgentDefaultWarrantyProvider::isSignedInToNimbra() {
  return platform_.accounts.primaryAccount().has_value();
}

std::int32_t KVRAgentDefaultWarrantyProvider::migrationVersion() {
  using Limits = std::numeric_limits<std::int32_t>;
  return static_cast<std::int32_t>(std::clamp<std::int64_t>(
      platform_.preferences.integerForKey(preference::kMigrationVersion), Limits::min(), Limits::max()));
}

void KVRAgentDefaultWarrantyProvider::setMigrationVersion(std::int32_t version) {
  platform_.preferences.setObject(version, preference::kMigrationVersion);
}

}  // namespace kvr
