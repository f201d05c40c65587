#pragma once

namespace kvr::preference {

/// Length of a day in eligibility arithmetic: number, seconds. Registered; an operator may store another.
inline constexpr const char* kOneDayInterval = "OneDayInterval";
/// Override of every warranty's conversion date: epoch number. Never written by the agent.
inline constexpr const char* kConversionDate = "ConversionDate";
/// How long a cached warranty counts as fresh: number, seconds. Registered.
inline constexpr const char* kCachedWarrantyValidityDuration = "CachedWarrantyValidityDuration";
/// The data migration level reached: integer. Written by migration.
inline constexpr const char* kMigrationVersion = "KVRMigrationVersion";
/// Coverage endpoints for this device and for every other: string, URL. Registered.
inline constexpr const char* kWarrantyURL = "WarrantyURL";
inline constexpr const char* kWearablesWarrantyURL = "WearablesWarrantyURL";

/// Metadata of a cached warranty beside `names::kLastUpdatedDate`: strings. The downloader writes the three
/// under the serial hash and "_"; without that prefix they are the earlier layout's, read and removed by
/// migration.
inline constexpr const char* kCachedWarrantyLocale = "CachedWarrantyLocale";
inline constexpr const char* kCachedWarrantyVersion = "CachedWarrantyVersion";

/// The version pair: integers. Registered; the same two keys stand inside every version-pair dictionary.
inline constexpr const char* kLowServerVersion = "LowServerVersion";
inline constexpr const char* kHighServerVersion = "HighServerVersion";
/// Where the service publishes its version pair: string, URL. Registered.
inline constexpr const char* kServerVersionURL = "ServerVersionURL";
/// The server pair last used: dictionary. Written by the version negotiation, removed before each download.
inline constexpr const char* kServerVersionCache = "ServerVersionCache";
/// Used instead of any published pair: dictionary. Never written by the agent.
inline constexpr const char* kServerVersionOverride = "ServerVersionOverride";
/// Web-flow URL handed to clients on internal installations: string. Never written by the agent.
inline constexpr const char* kWebFlowURL = "WebFlowURL";

}  // namespace kvr::preference

namespace kvr {

/// The settings application, for whom the agent works when it does not know better.
inline constexpr const char* kPreferencesBundleID = "com.tarsil.Preferences";

/// The cache format written with every download; a cache of any other is not used.
inline constexpr const char* kCacheFormatVersion = "2";

}  // namespace kvr
