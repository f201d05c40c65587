#pragma once

#include "client/kvrctl/Output.h"
#include "client/kvrctl/Report.h"

namespace kvr::client {

/// Tells what changes as it happens, a line each: notifications on the bus, agents that come and go,
/// follow-ups, activities, downloads. In JSON each line is a document. Sleeps in between. Ends with SIGINT or
/// SIGTERM, or when the bus does.
Status monitor(const Report& report, bool inJSON);

}  // namespace kvr::client
