#pragma once

#include "platform/value/Error.h"
#include "platform/value/Value.h"

struct sd_bus_message;

namespace kvr {

// How values are encoded on the bus.
//
// Arguments and replies have one of the types "s", "d", "t", "b", "a{sv}" and "aa{sv}". A *record* is the
// dictionary of such a value, and any dictionary directly under one of its keys: a device info with its
// device and its warranty. A value under a key of a record is a *tree*, encoded as: string s, bool b, integer
// x (t above the signed range), real d, date (d), data ay, array av, dictionary a{sv}.
//
// A tree that the bus cannot carry (nested too deep; with a null; with a text that has a NUL or is not
// interchangeable Unicode) is sent as one ay: a binary property list of it. Only the value under that key of
// the innermost record is packed, so every client can still read the rest. Data that happens to begin like a
// property list is packed too, so that the receiver can always tell the two apart.

/// No value larger than this is sent: the bus disconnects a sender that exceeds its limit, by default 32 MiB
/// per message.
inline constexpr std::size_t kMaximumBusValueSize = (std::size_t{32} << 20) - (std::size_t{64} << 10);

/// Appends a value as one of the types above; null is sent as the type's empty value. After an error (domain
/// "bus") the message is incomplete and must not be sent.
std::optional<Error> appendBusValue(sd_bus_message* message, std::string_view type, const Value& value);

/// Reads a value of one of the types above. Whatever the sender wrote, this neither throws nor recurses
/// deeper than the bus allows. A type that cannot occur in a tree reads as null.
Result<Value> readBusValue(sd_bus_message* message, std::string_view type);

}  // namespace kvr
