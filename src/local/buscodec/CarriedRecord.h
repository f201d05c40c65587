#pragma once

#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <string_view>

namespace kvr {

// Which values the bus can carry, and how the others are packed.

/// The bus disconnects a sender whose message nests more containers than this.
inline constexpr int kMaximumBusContainers = 64;

/// A value's own dictionary is a record, and so is each dictionary directly under its keys.
inline constexpr int kBusRecordLevels = 2;

inline constexpr std::string_view kBinaryPropertyListStart = "bplist00";

bool busCanCarryText(std::string_view text);

/// The record as it is sent: each tree that cannot be carried, and data that looks like a property list, is
/// packed into data. `containers` is the number of containers around the record. An error when a key cannot
/// be carried or a tree cannot be packed.
Result<Value> carriedRecord(const Value& record, int containers);

/// The end of the encoded record, as a byte offset, if it begins at byte `offset` of a message.
std::size_t endOnBus(std::size_t offset, const Value::Dictionary& record);

}  // namespace kvr
