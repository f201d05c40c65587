#pragma once

namespace kvr::preference {

/// Override of the local serial number: string. Internal installations only; never written by the agent.
inline constexpr const char* kSerialNumber = "SerialNumber";
/// Activation date of the local device: date. Written by the post-upgrade activity.
inline constexpr const char* kDefaultDeviceActivationDate = "DefaultDeviceActivationDate";
/// Dictionary of strings whose values are watch serial numbers: override of the paired watches (internal
/// installations only), and a map from serial number to serial number. Never written by the agent.
inline constexpr const char* kPairedWatchesSerialNumbers = "PairedWatchesSerialNumbers";
/// Behind an overridden watch's serial number: seconds from now to its activation. Never written by the
/// agent.
inline constexpr const char* kActivationIntervalSuffix = ".activationInterval";

}  // namespace kvr::preference

namespace kvr {

inline constexpr const char* kFeatureDomain = "Kavrel";
inline constexpr const char* kPairedWatchesFeature = "Bravik_3_0";

}  // namespace kvr
