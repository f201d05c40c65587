#pragma once

#include "core/warranty/WarrantyKeys.h"
#include "platform/names/Names.h"
#include "platform/text/SHA256Hash.h"

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
      : lastUpdatedDateKey(prefix + names::kLastUpdatedDate),
        localeKey(prefix + preference::kCachedWarrantyLocale),
        versionKey(prefix + preference::kCachedWarrantyVersion) {}
};

}  // namespace kvr
