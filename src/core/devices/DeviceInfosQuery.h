#pragma once

#include "core/devices/KVRDeviceInfo.h"
#include "platform/log/Completion.h"

#include <cstdint>
#include <functional>
#include <optional>

namespace kvr {

/// All devices with their warranties; nothing if they could not be listed.
using DeviceInfosAnswer = Completion<std::optional<KVRDeviceInfoList>>;

/// Looks up all devices with their warranties, for activities and monitors. `policy` is a `LookupPolicy`;
/// `updateFollowUps` also updates the follow-ups from the result. Answers once, on any thread.
using DeviceInfosQuery =
    std::function<void(std::uint64_t policy, bool updateFollowUps, DeviceInfosAnswer answer)>;

}  // namespace kvr
