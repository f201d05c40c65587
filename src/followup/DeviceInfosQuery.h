#pragma once

#include "devices/KVRDeviceInfo.h"
#include "platform/Completion.h"
#include "platform/Platform.h"

#include <cstdint>
#include <functional>
#include <optional>

namespace kvr {

/// All devices with their warranties; nothing when they could not be listed.
using DeviceInfosAnswer = Completion<std::optional<KVRDeviceInfoList>>;
/// How an activity asks for them, by a lookup policy. Answers once, on any thread.
using DeviceInfosQuery = std::function<void(std::uint64_t policy, DeviceInfosAnswer answer)>;

/// Asks a new agent of the settings application, which leaves follow-ups alone.
DeviceInfosQuery newAgentQuery(Platform& platform);

}  // namespace kvr
