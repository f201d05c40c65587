#pragma once

#include "core/agent/KVRAgentProtocol.h"
#include "core/devices/DeviceInfosQuery.h"
#include "platform/Platform.h"

#include <memory>

namespace kvr {

/// Makes a query that asks this agent.
DeviceInfosQuery deviceInfosQueryOf(std::shared_ptr<KVRAgentProtocol> agent, Log& log);
/// Makes a query that creates a new agent for the settings application each time and asks that one.
DeviceInfosQuery newAgentQuery(Platform& platform);

/// Puts every activity of the agent into the platform's registry.
void registerActivities(Platform& platform);

}  // namespace kvr
