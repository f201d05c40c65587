#pragma once

#include "signing/SHA256Hash.h"
#include "warranty/WarrantyKeys.h"

#include <string>

namespace kvr {

/// The preference keys of one device's cache metadata.
struct CacheMetadata {
  explicit CacheMetadata(std::string_view serialNumber)
      : CacheMetadata(sha256Hash(serialNumber) + "_", nullptr) {}

  std::string lastUpdatedDateKey;  ///< date: when the warranty was downloaded and cached
  std::string localeKey;           ///< string: the preferred locale at that moment
  std::string versionKey;          ///< string: the cache format

 private:
  CacheMetadata(const std::string& prefix, std::nullptr_t)
      : lastUpdatedDateKey(prefix + preference::kCachedWarrantyLastUpdatedDate),
        localeKey(prefix + preference::kCachedWarrantyLocale),
        versionKey(prefix + preference::kCachedWarrantyVersion) {}
};

}  // namespace kvr
