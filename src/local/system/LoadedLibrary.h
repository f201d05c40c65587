#pragma once

#include "platform/value/Error.h"

namespace kvr {

/// Loads one of the agent's own libraries, which stand beside the running program or where they are installed
/// relative to it ("../lib/kvragent"), and finds a symbol in it. The library stays loaded. An error, in
/// domain "loading", names every place that was tried.
Result<void*> loadSymbol(const char* library, const char* symbol);

}  // namespace kvr
