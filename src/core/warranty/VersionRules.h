#pragma once

#include <cstdint>
#include <span>

namespace kvr {

/// How the service's versions are looked up. Callers inside the agent only; any other number is `kDefault`.
struct ServerLookupPolicy {
  static constexpr std::uint64_t kDefault = 0;    ///< the cache, else the asset
  static constexpr std::uint64_t kCacheOnly = 1;  ///< never a fetch: answers before it returns
  static constexpr std::uint64_t kRefresh = 2;    ///< the asset, else the cache
};

/// The sources for the service's version pair.
enum class VersionSource {
  Override,  ///< of the operator; comes before all others under every policy
  Cache,
  Asset,
  ClientVersions  ///< the agent's own: the service is taken to speak what the agent speaks
};

inline constexpr VersionSource kDefaultSources[] = {VersionSource::Cache, VersionSource::Asset,
                                                    VersionSource::ClientVersions};
inline constexpr VersionSource kCacheOnlySources[] = {VersionSource::Cache, VersionSource::ClientVersions};
inline constexpr VersionSource kRefreshSources[] = {VersionSource::Asset, VersionSource::Cache,
                                                    VersionSource::ClientVersions};

/// The sources in the order in which they are tried; the last one always has a pair.
///
/// | policy     | sources                       | stores the pair    |
/// |------------|-------------------------------|--------------------|
/// | default    | cache, asset, client versions | one from the asset |
/// | cache only | cache, client versions        | never              |
/// | refresh    | asset, cache, client versions | always             |
/// | any        | override, when there is one   | always             |
constexpr std::span<const VersionSource> versionSources(std::uint64_t policy) {
  if (policy == ServerLookupPolicy::kCacheOnly) return kCacheOnlySources;
  if (policy == ServerLookupPolicy::kRefresh) return kRefreshSources;
  return kDefaultSources;
}

/// Whether a pair from this source becomes the cached one.
constexpr bool storesPair(std::uint64_t policy, VersionSource source) {
  if (source == VersionSource::Override || policy == ServerLookupPolicy::kRefresh) return true;
  return policy != ServerLookupPolicy::kCacheOnly && source == VersionSource::Asset;
}

}  // namespace kvr
