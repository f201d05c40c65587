#pragma once

namespace kvr {

namespace preference {

/// Behind an activity's identifier: the date before which it does not run. Written by `KVRScheduler`.
inline constexpr const char* kTargetDateSuffix = ".TargetDate";
/// The OS version at the last post-upgrade run: string. Written by that activity.
inline constexpr const char* kPostUpgradeOSVersion = "PostUpgradeOSVersionKey";
/// For when the conversion outreach was last scheduled: date. Written by the downloader and after a boot; the
/// downloader only ever moves it earlier.
inline constexpr const char* kConversionOutreachScheduledDate = "ConversionOutreachScheduledDate";

}  // namespace preference

namespace activity {

inline constexpr const char* kPostUpgrade = "com.tarsil.kvragent.upgrade";
inline constexpr const char* kPostBoot = "com.tarsil.kvragent.boot";
inline constexpr const char* kOutreach = "com.tarsil.kvragent.outreach";
inline constexpr const char* kConversionOutreach = "com.tarsil.kvragent.conversionoutreach";

}  // namespace activity
}  // namespace kvr
