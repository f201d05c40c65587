#pragma once

#include "platform/value/Error.h"

#include <systemd/sd-bus.h>

#include <cerrno>
#include <memory>
#include <string>
#include <string_view>
#include <system_error>

namespace kvr {

// Owning handles of sd-bus objects. None is thread-safe: use a bus and everything of it on one thread.

struct BusRelease {
  void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
  void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
  void operator()(sd_bus_slot* slot) const { sd_bus_slot_unref(slot); }
};

using BusRef = std::unique_ptr<sd_bus, BusRelease>;
using BusMessageRef = std::unique_ptr<sd_bus_message, BusRelease>;
/// A match, filter, object or pending call; destroying it cancels it.
using BusSlotRef = std::unique_ptr<sd_bus_slot, BusRelease>;

inline constexpr const char* kBusName = "org.freedesktop.DBus";
inline constexpr const char* kBusPath = "/org/freedesktop/DBus";

/// Whether a reply comes from the bus itself, or from this process about a bus that is gone. Many buses
/// forward unrequested replies, and a reply is matched to its call by an easily guessed number. So the answer
/// to a question to the bus must not be believed from any other peer.
inline bool isFromBus(sd_bus_message* reply) {
  const char* const sender = sd_bus_message_get_sender(reply);
  return sender == nullptr || std::string_view(sender) == kBusName;
}

/// An error of one call.
class BusError {
 public:
  BusError() = default;
  ~BusError() { sd_bus_error_free(&error_); }
  BusError(const BusError&) = delete;
  BusError& operator=(const BusError&) = delete;

  sd_bus_error* get() { return &error_; }
  const char* name() const { return error_.name ? error_.name : ""; }
  const char* message() const { return error_.message ? error_.message : ""; }

 private:
  sd_bus_error error_{};
};

/// Runs the body of an sd-bus callback and returns its result; no exception may leave such a callback.
template <class Do>
int guardedBusCallback(const Do& work) {
  try {
    return work();
  } catch (...) {
    return -ENOMEM;
  }
}

/// Describes a negative result of sd-bus; `what` says what failed.
inline Error busError(int result, const std::string& what) {
  return {"bus", -result, what + ": " + std::generic_category().message(-result)};
}

}  // namespace kvr
