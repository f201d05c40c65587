// The cache of KVRWarranty: one property-list file per device, named by the serial hash.

#include "core/warranty/CacheMetadata.h"
#include "core/warranty/KVRWarranty.h"
#include "core/warranty/WarrantyKeys.h"
#include "platform/names/Names.h"
#include "platform/text/SHA256Hash.h"

namespace kvr {
namespace {

/// The cache's directory, with a trailing slash.
std::string directory(Platform& platform) {
  return platform.files.homeDirectory() + "/" + std::string(names::kCacheFolder) + "/";
}

std::string pathFor(Platform& platform, const std::optional<std::string>& serialNumber) {
  if (!serialNumber) return KVRWarranty::_legacyWarrantyPath(platform);
  auto path = KVRWarranty::_warrantyPathForSerialNumberFormat(platform);
  return path.replace(path.rfind("%@"), 2, sha256Hash(*serialNumber));
}

std::shared_ptr<KVRWarranty> read(Platform& platform, const std::string& path) {
  const auto tree = platform.propertyLists.read(path, PropertyListFiles::Expected::Dictionary,
                                                PropertyListFiles::WhenDamaged::SetAside);
  if (!tree || tree->isNull()) return nullptr;
  return KVRWarranty::warrantyWithDictionary(platform, *tree);
}

}  // namespace

std::string KVRWarranty::_warrantyPathForSerialNumberFormat(Platform& platform) {
  return directory(platform) + "%@_Warranty.plist";
}

std::string KVRWarranty::_legacyWarrantyPath(Platform& platform) {
  return directory(platform) + "Warranty.plist";
}

void KVRWarranty::cacheWarranty(const std::optional<std::string>& serial) const {
  const auto path = pathFor(platform_, serial);
  platform_.log.standard("%s -> %@", "-[KVRWarranty cacheWarranty:]", path);
  // If this fails (unsuitable content, full disk), the only harm is another download later.
  (void)platform_.propertyLists.write(path, dictionaryRepresentation(), PropertyListEncoding::XML);
}

std::shared_ptr<KVRWarranty> KVRWarranty::cachedWarrantyForSerialNumber(
    Platform& platform, const std::optional<std::string>& serialNumber) {
  const auto path = pathFor(platform, serialNumber);
  platform.log.standard("%s : warrantyPath : %@", "+[KVRWarranty cachedWarrantyForSerialNumber:]", path);
  return read(platform, path);
}

std::shared_ptr<KVRWarranty> KVRWarranty::migrateLegacyCachedWarrantyIfNeededForSerialNumber(
    Platform& platform, const std::string& serialNumber) {
  auto& preferences = platform.preferences;
  const auto legacyPath = _legacyWarrantyPath(platform);
  auto warranty = read(platform, legacyPath);
  if (!warranty) return nullptr;

  platform.log.standard("Migrating legacy warranty..");
  warranty->cacheWarranty(serialNumber);

  const CacheMetadata metadata(serialNumber);
  if (const auto date = preferences.objectForKey(names::kLastUpdatedDate); !date.isNull()) {
    preferences.setObject(date, metadata.lastUpdatedDateKey);
    preferences.removeObject(names::kLastUpdatedDate);
  }
  // Locale and version move as a pair; a version without a locale stays where it is.
  if (const auto locale = preferences.objectForKey(preference::kCachedWarrantyLocale); !locale.isNull()) {
    preferences.setObject(locale, metadata.localeKey);
    preferences.removeObject(preference::kCachedWarrantyLocale);
    preferences.setObject(preferences.objectForKey(preference::kCachedWarrantyVersion), metadata.versionKey);
    preferences.removeObject(preference::kCachedWarrantyVersion);
  }
  (void)platform.files.remove(legacyPath);
  return warranty;
}

}  // namespace kvr
