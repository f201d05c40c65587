#pragma once

#include "platform/value/Error.h"
#include "platform/value/Value.h"

struct sd_bus_message;

namespace kvr {

// Values on the bus.
//
// What a call takes and replies has one of the types "s", "d", "t", "b", "a{sv}" and "aa{sv}". A *record* is
// the dictionary of such a value, and any dictionary directly under one of its keys: a device info with its
// device and its warranty. What stands under the keys of a record is a *tree*, carried as: string s, bool b,
// integer x (t above the signed range), real d, date (d), data ay, array av, dictionary a{sv}.
//
// A tree that the bus cannot carry whole (nested too deep, a null, a text with NUL or with what is not
// interchangeable Unicode) travels as one ay: a binary property list of it. The place is the innermost
// record's key, so the rest of the value stays readable to every client. Data that happens to begin like a
// property list travels in the same way, so that reading such a place is unambiguous.

/// No value is sent that takes more bytes than this: the bus drops a sender that exceeds its limit, which is
/// 32 MiB a message where nobody has raised it.
inline constexpr std::size_t kMaximumBusValueSize = (std::size_t{32} << 20) - (std::size_t{64} << 10);

/// Appends a value as one of the types above; null is sent as the type's empty value. On failure, an error in
/// domain "bus", the message is spoilt and must not be sent.
std::optional<Error> appendBusValue(sd_bus_message* message, std::string_view type, const Value& value);

/// Reads a value of one of the types above. Whatever a sender wrote, this neither throws nor recurses deeper
/// than the bus allows. A kind that no tree has, under a key or in an array, reads as null.
Result<Value> readBusValue(sd_bus_message* message, std::string_view type);

}  // namespace kvr
