#pragma once

#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <string_view>

namespace kvr {

// What of a value the bus can carry, and what takes the place of the rest.

/// The bus drops a sender whose message has more containers than this in one another.
inline constexpr int kMaximumBusContainers = 64;

/// Records are a value's own dictionary and the dictionaries directly under its keys.
inline constexpr int kBusRecordLevels = 2;

inline constexpr std::string_view kBinaryPropertyListStart = "bplist00";

bool busCanCarryText(std::string_view text);

/// The record as it travels: every tree that cannot be carried, and data that looks like a property list, is
/// packed into data. `containers` stand around the record. An error when a key cannot be carried, or a tree
/// cannot be packed either.
Result<Value> carriedRecord(const Value& record, int containers);

/// Where the encoded record ends if it begins at byte `offset` of a message.
std::size_t endOnBus(std::size_t offset, const Value::Dictionary& record);

}  // namespace kvr
