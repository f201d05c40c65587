#pragma once

#include "core/devices/KVRDeviceInfo.h"
#include "platform/log/Completion.h"

#include <cstdint>
#include <functional>
#include <optional>

namespace kvr {

/// All devices with their warranties; nothing when they could not be listed.
using DeviceInfosAnswer = Completion<std::optional<KVRDeviceInfoList>>;

/// How activities and monitors ask for all devices with their warranties, looked up by a policy
/// (`LookupPolicy`). `updateFollowUps` also brings the follow-ups up to date with what was found. Answers
/// once, on any thread.
using DeviceInfosQuery =
    std::function<void(std::uint64_t policy, bool updateFollowUps, DeviceInfosAnswer answer)>;

}  // namespace kvr
