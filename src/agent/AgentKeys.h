#pragma once

namespace kvr {

inline constexpr const char* kServiceName = "com.tarsil.kvragent";
inline constexpr const char* kRequiredEntitlement = "com.tarsil.private.kvragent";
/// The settings application, for whom the agent works when it does not know better.
inline constexpr const char* kPreferencesBundleID = "com.tarsil.Preferences";

namespace preference {

/// Delay of the outreach after a cloud account was added: number, seconds. Registered.
inline constexpr const char* kPostUpgradeOutreachDelay = "PostUpgradeOutreachDelay";
/// The post-upgrade activity has run: bool. Written by that activity.
inline constexpr const char* kPostUpgradeActivityCompleted = "PostUpgradeActivityCompleted";
/// The first outreach has been scheduled: bool. Written by the agent and by the post-upgrade activity.
inline constexpr const char* kInitialOutreachActivityScheduled = "InitialOutreachActivityScheduled";
/// Map from serial number to serial number for other accessories: dictionary of strings. Never written here.
inline constexpr const char* kPairedBluetoothDevicesSerialNumbers = "PairedBluetoothDevicesSerialNumbers";

}  // namespace preference
}  // namespace kvr
