#pragma once

#include <cstdint>
#include <optional>

namespace kvr {

/// How a warranty is looked up. Clients send any number; what is neither `kDefault` nor `kRefresh` is
/// `kCacheOnly`.
struct LookupPolicy {
  static constexpr std::uint64_t kDefault = 0;    ///< the cache while it is valid and fresh, else a download
  static constexpr std::uint64_t kCacheOnly = 1;  ///< never a download
  static constexpr std::uint64_t kRefresh = 2;    ///< always a download, and only its answer
};

/// What a cached warranty is worth.
enum class CacheValidity {
  None,             ///< there is no cached warranty
  OutdatedVersion,  ///< written in another cache format
  OtherLocale,      ///< fetched for another language than the user's present one
  SignedOut,        ///< no primary cloud account: what was cached for one is not shown
  Valid,
};

struct CacheFacts {
  bool present = false;
  bool versionMatches = false;
  bool localeMatches = false;
  bool signedIn = false;
};

/// The first reason against the cache, in this order.
constexpr CacheValidity cacheValidity(const CacheFacts& facts) {
  if (!facts.present) return CacheValidity::None;
  if (!facts.versionMatches) return CacheValidity::OutdatedVersion;
  if (!facts.localeMatches) return CacheValidity::OtherLocale;
  if (!facts.signedIn) return CacheValidity::SignedOut;
  return CacheValidity::Valid;
}

/// Whether to download, and whether the cached warranty may be answered when the download yields nothing or
/// none is made.
struct LookupDecision {
  bool downloads;
  bool cacheMayAnswer;

  friend bool operator==(const LookupDecision&, const LookupDecision&) = default;
};

/// `secondsFresh` is how long the cached warranty stays fresh (0 or less: it is stale), nothing when it is
/// not known when it was downloaded.
///
/// | policy     | cache valid | fresh | downloads | the cache may answer |
/// |------------|-------------|-------|-----------|----------------------|
/// | default    | yes         | yes   | no        | yes                  |
/// | default    | yes         | no    | yes       | yes                  |
/// | default    | no          |       | yes       | no                   |
/// | cache only | yes         |       | no        | yes                  |
/// | cache only | no          |       | no        | no                   |
/// | refresh    |             |       | yes       | no                   |
constexpr LookupDecision lookupDecision(std::uint64_t policy, bool cacheValid,
                                        std::optional<double> secondsFresh) {
  if (policy == LookupPolicy::kRefresh) return {true, false};
  if (policy == LookupPolicy::kDefault) {
    const bool fresh = cacheValid && secondsFresh && *secondsFresh > 0;
    return {!fresh, cacheValid};
  }
  return {false, cacheValid};
}

}  // namespace kvr
