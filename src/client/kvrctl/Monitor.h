#pragma once

#include "client/kvrctl/Output.h"
#include "client/kvrctl/Report.h"

namespace kvr::client {

/// Prints each change as it happens, one line each (a JSON document if `inJSON`): notifications on the bus,
/// agents starting and ending, follow-ups, activities, downloads, and what the agent tells of devices. Ends
/// on SIGINT or SIGTERM; as a failure when the bus goes away, or nobody reads the output any more.
Status monitor(const Report& report, bool inJSON);

}  // namespace kvr::client
