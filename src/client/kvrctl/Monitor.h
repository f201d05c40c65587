#pragma once

#include "client/kvrctl/Output.h"
#include "client/kvrctl/Report.h"

namespace kvr::client {

/// Prints each change as it happens, one line each (a JSON document if `inJSON`): notifications on the bus,
/// agents starting and ending, follow-ups, activities, downloads. Ends on SIGINT or SIGTERM, or when the bus
/// goes away.
Status monitor(const Report& report, bool inJSON);

}  // namespace kvr::client
