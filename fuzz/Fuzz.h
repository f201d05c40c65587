#pragma once

#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <string>
#include <string_view>

namespace kvr::fuzz {

/// What a target does with one input: it takes in anything, and what must hold of it holds. Each target
/// defines it once; `Engine.cpp` feeds it from libFuzzer, `Replay.cpp` from files.
void run(std::string_view input);

/// Ends the program with what is wrong unless it holds.
void require(bool holds, const char* what, const std::string& detail = {});

/// A tree that was read comes back equal from the binary encoding, and from XML if XML takes it.
void requireRoundTrips(const Value& tree);

/// Reads with one reader of property lists; what it takes has its round trips.
void readAndWriteBack(std::string_view input, Result<Value> (*read)(std::string_view));

}  // namespace kvr::fuzz
