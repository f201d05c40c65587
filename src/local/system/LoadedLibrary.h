#pragma once

#include "platform/value/Error.h"

namespace kvr {

/// Loads one of the agent's own libraries and finds a symbol in it. The library is looked for beside the
/// running program and in "../lib/kvragent" relative to it, and stays loaded. An error (domain "loading")
/// names every path that was tried.
Result<void*> loadSymbol(const char* library, const char* symbol);

}  // namespace kvr
