#pragma once

namespace kvr::preference {

/// Length of a day for eligibility: number, seconds. Has a registered default; an operator can store another.
inline constexpr const char* kOneDayInterval = "OneDayInterval";
/// Override of every warranty's conversion date: epoch number. Never written by the agent.
inline constexpr const char* kConversionDate = "ConversionDate";
/// How long a cached warranty counts as fresh: number, seconds. Has a registered default.
inline constexpr const char* kCachedWarrantyValidityDuration = "CachedWarrantyValidityDuration";
/// The data migration level reached: integer. Written by migration.
inline constexpr const char* kMigrationVersion = "KVRMigrationVersion";
/// Coverage endpoints for this device and for every other: string, URL. Have registered defaults.
inline constexpr const char* kWarrantyURL = "WarrantyURL";
inline constexpr const char* kWearablesWarrantyURL = "WearablesWarrantyURL";

/// Metadata of a cached warranty, with `names::kLastUpdatedDate`: strings. The downloader writes the three
/// keys with the serial hash and "_" as prefix. Without the prefix they belong to the earlier layout;
/// migration reads and removes them.
inline constexpr const char* kCachedWarrantyLocale = "CachedWarrantyLocale";
inline constexpr const char* kCachedWarrantyVersion = "CachedWarrantyVersion";

/// The agent's version pair: integers. Have registered defaults. Every version-pair dictionary has the same
/// two keys.
inline constexpr const char* kLowServerVersion = "LowServerVersion";
inline constexpr const char* kHighServerVersion = "HighServerVersion";
/// Where the service publishes its version pair: string, URL. Has a registered default.
inline constexpr const char* kServerVersionURL = "ServerVersionURL";
/// The server pair last used: dictionary. Written by the version negotiation, removed before each download.
inline constexpr const char* kServerVersionCache = "ServerVersionCache";
/// Used instead of any published pair: dictionary. Never written by the agent.
inline constexpr const char* kServerVersionOverride = "ServerVersionOverride";
/// Web-flow URL handed to clients on internal installations: string. Never written by the agent.
inline constexpr const char* kWebFlowURL = "WebFlowURL";

}  // namespace kvr::preference

namespace kvr {

/// The settings application, the client that the agent assumes if it knows no other.
inline constexpr const char* kPreferencesBundleID = "com.tarsil.Preferences";

/// The cache format written with every download; a cache in any other format is not used.
inline constexpr const char* kCacheFormatVersion = "2";

}  // namespace kvr
