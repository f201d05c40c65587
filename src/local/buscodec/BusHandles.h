#pragma once

#include "platform/value/Error.h"

#include <systemd/sd-bus.h>

#include <cerrno>
#include <memory>
#include <string>
#include <string_view>
#include <system_error>

namespace kvr {

// Owners of sd-bus objects. None of them is thread-safe: a bus and everything of it stays on one thread.

struct BusRelease {
  void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
  void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
  void operator()(sd_bus_slot* slot) const { sd_bus_slot_unref(slot); }
};

using BusRef = std::unique_ptr<sd_bus, BusRelease>;
using BusMessageRef = std::unique_ptr<sd_bus_message, BusRelease>;
/// A match, filter, object or pending call; letting it go cancels it.
using BusSlotRef = std::unique_ptr<sd_bus_slot, BusRelease>;

inline constexpr const char* kBusName = "org.freedesktop.DBus";
inline constexpr const char* kBusPath = "/org/freedesktop/DBus";

/// Whether a reply is the bus's own, or this process's about a bus that is gone. Many buses hand on replies
/// that nobody asked for, and replies are told apart by a number that is easily guessed: whoever asks the bus
/// must not take another peer's word for it.
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

/// Runs what a callback of sd-bus is there for and returns its result; nothing may leave such a callback.
template <class Do>
int guardedBusCallback(const Do& work) {
  try {
    return work();
  } catch (...) {
    return -ENOMEM;
  }
}

/// What a negative result of sd-bus means; `what` could not be done.
inline Error busError(int result, const std::string& what) {
  return {"bus", -result, what + ": " + std::generic_category().message(-result)};
}

}  // namespace kvr
