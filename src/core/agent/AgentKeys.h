#pragma once

namespace kvr {

namespace preference {

/// Delay of the outreach after a cloud account was added: number, seconds. Has a registered default.
inline constexpr const char* kPostUpgradeOutreachDelay = "PostUpgradeOutreachDelay";
/// Serial numbers of accessories, each mapped to the one to look up instead: dictionary of strings. Never
/// written by the agent.
inline constexpr const char* kPairedBluetoothDevicesSerialNumbers = "PairedBluetoothDevicesSerialNumbers";

}  // namespace preference
}  // namespace kvr
