#pragma once

#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <string>
#include <string_view>

namespace kvr::fuzz {

/// Runs one target with one input. It accepts any input and checks the properties that must always hold. Each
/// target defines it once; `Engine.cpp` calls it from libFuzzer, `Replay.cpp` with files.
void run(std::string_view input);

/// Ends the program with an error message unless `holds`.
void require(bool holds, const char* what, const std::string& detail = {});

/// Checks that a tree comes back equal from the binary encoding, and from XML if XML can hold it.
void requireRoundTrips(const Value& tree);

/// Reads with one property list reader; if that succeeds, checks the round trips.
void readAndWriteBack(std::string_view input, Result<Value> (*read)(std::string_view));

}  // namespace kvr::fuzz
