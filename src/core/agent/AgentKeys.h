#pragma once

namespace kvr {

namespace preference {

/// Delay of the outreach after a cloud account was added: number, seconds. Registered.
inline constexpr const char* kPostUpgradeOutreachDelay = "PostUpgradeOutreachDelay";
/// Map from serial number to serial number for other accessories: dictionary of strings. Never written here.
inline constexpr const char* kPairedBluetoothDevicesSerialNumbers = "PairedBluetoothDevicesSerialNumbers";

}  // namespace preference
}  // namespace kvr
