#pragma once

namespace kvr::preference {

/// The OS version at the last post-upgrade run: string. Written by that activity.
inline constexpr const char* kPostUpgradeOSVersion = "PostUpgradeOSVersionKey";
/// The date for which the conversion outreach was last scheduled: date. Written after warranty downloads,
/// which only move it earlier, and by the post-boot activity.
inline constexpr const char* kConversionOutreachScheduledDate = "ConversionOutreachScheduledDate";

/// The post-upgrade activity has run: bool. Written by that activity.
inline constexpr const char* kPostUpgradeActivityCompleted = "PostUpgradeActivityCompleted";
/// The first outreach has been scheduled: bool. Written by the agent and by the post-upgrade activity.
inline constexpr const char* kInitialOutreachActivityScheduled = "InitialOutreachActivityScheduled";

}  // namespace kvr::preference
