#pragma once

#include "core/agent/KVRAgentProtocol.h"
#include "core/devices/DeviceInfosQuery.h"
#include "platform/Platform.h"

#include <memory>

namespace kvr {

/// Asks this agent each time.
DeviceInfosQuery deviceInfosQueryOf(std::shared_ptr<KVRAgentProtocol> agent, Log& log);
/// Asks a new agent of the settings application each time.
DeviceInfosQuery newAgentQuery(Platform& platform);

/// Puts every activity of the agent into the platform's registry.
void registerActivities(Platform& platform);

}  // namespace kvr
