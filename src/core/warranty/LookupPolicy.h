#pragma once

#include "core/warranty/WarrantyKeys.h"
#include "platform/value/Date.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <optional>
#include <string>

namespace kvr {

/// How a warranty is looked up. Clients can send any number; others than these count as `kCacheOnly`.
struct LookupPolicy {
  static constexpr std::uint64_t kDefault = 0;    ///< the cache while it is valid and fresh, else a download
  static constexpr std::uint64_t kCacheOnly = 1;  ///< never a download
  static constexpr std::uint64_t kRefresh = 2;    ///< always a download, and only its answer
};

/// Whether a cached warranty may be used, and why not.
enum class CacheValidity {
  None,             ///< there is no cached warranty
  OutdatedVersion,  ///< written in another cache format
  OtherLocale,      ///< fetched for another language than the user's present one
  SignedOut,        ///< no primary cloud account; a warranty cached for one is not shown
  Valid,
};

/// What is known of a device's cached warranty at one moment.
struct CacheFacts {
  bool present = false;
  Value version;                ///< as it is stored beside the warranty
  Value locale;                 ///< the same
  std::string preferredLocale;  ///< the user's present one
  bool signedIn = false;        ///< whether there is a primary cloud account
  std::optional<Date> updated;  ///< when the warranty was downloaded
  double validityDuration = 0;  ///< how long it stays fresh, in seconds
};

/// The verdict on a cached warranty. `secondsFresh` is how long a valid one stays fresh, 0 or less when it is
/// stale; nothing when it is not valid, or not known to have been downloaded.
struct CacheVerdict {
  CacheValidity validity = CacheValidity::None;
  std::optional<double> secondsFresh;

  bool isValid() const { return validity == CacheValidity::Valid; }
};

/// The first reason against the cache, in this order.
inline CacheValidity cacheValidity(const CacheFacts& facts) {
  if (!facts.present) return CacheValidity::None;
  if (facts.version != Value(kCacheFormatVersion)) return CacheValidity::OutdatedVersion;
  if (facts.locale != Value(facts.preferredLocale)) return CacheValidity::OtherLocale;
  if (!facts.signedIn) return CacheValidity::SignedOut;
  return CacheValidity::Valid;
}

inline CacheVerdict judgeCache(const CacheFacts& facts, Date now) {
  CacheVerdict verdict{cacheValidity(facts), {}};
  if (verdict.isValid() && facts.updated) {
    verdict.secondsFresh = (*facts.updated - now) + facts.validityDuration;
  }
  return verdict;
}

/// Whether to download, and whether the cached warranty may be answered when the download yields nothing or
/// none is made.
struct LookupDecision {
  bool downloads;
  bool cacheMayAnswer;

  friend bool operator==(const LookupDecision&, const LookupDecision&) = default;
};

/// | policy     | cache valid | fresh | downloads | the cache may answer |
/// |------------|-------------|-------|-----------|----------------------|
/// | default    | yes         | yes   | no        | yes                  |
/// | default    | yes         | no    | yes       | yes                  |
/// | default    | no          |       | yes       | no                   |
/// | cache only | yes         |       | no        | yes                  |
/// | cache only | no          |       | no        | no                   |
/// | refresh    |             |       | yes       | no                   |
inline LookupDecision lookupDecision(std::uint64_t policy, const CacheVerdict& cache) {
  if (policy == LookupPolicy::kRefresh) return {true, false};
  if (policy == LookupPolicy::kDefault) {
    const bool fresh = cache.secondsFresh && *cache.secondsFresh > 0;
    return {!fresh, cache.isValid()};
  }
  return {false, cache.isValid()};
}

}  // namespace kvr
