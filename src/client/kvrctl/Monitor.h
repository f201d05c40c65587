#pragma once

#include "client/Report.h"

namespace kvr::client {

/// Prints what changes as it happens, a line each: notifications on the bus, agents that come and go,
/// follow-ups, activities. Sleeps in between. Ends when the bus does, or with SIGINT or SIGTERM; returns an
/// exit status.
int monitor(const Report& report);

}  // namespace kvr::client
