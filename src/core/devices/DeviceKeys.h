#pragma once

namespace kvr::preference {

/// Override of the local serial number: string. Internal installations only; never written by the agent.
inline constexpr const char* kSerialNumber = "SerialNumber";
/// Activation date of the local device: date. Written by the post-upgrade activity.
inline constexpr const char* kDefaultDeviceActivationDate = "DefaultDeviceActivationDate";
/// Dictionary of strings whose values are watch serial numbers. Overrides the paired watches (internal
/// installations only), and maps each key to the serial number to look up instead. Never written by the
/// agent.
inline constexpr const char* kPairedWatchesSerialNumbers = "PairedWatchesSerialNumbers";
/// Key suffix after an overridden watch's serial number: seconds from now to its activation. Never written by
/// the agent.
inline constexpr const char* kActivationIntervalSuffix = ".activationInterval";

}  // namespace kvr::preference

namespace kvr {

inline constexpr const char* kFeatureDomain = "Kavrel";
inline constexpr const char* kPairedWatchesFeature = "Bravik_3_0";

}  // namespace kvr
