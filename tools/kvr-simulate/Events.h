#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace kvr::simulate {

enum class EventKind {
  Call,          ///< a client calls the agent
  Offer,         ///< the service changes its answer about a device
  Watch,         ///< a watch is paired, unpaired, archived or restored
  Account,       ///< the owner signs in or out
  Token,         ///< the service no longer accepts the account's token
  Locale,        ///< the language changes
  Clock,         ///< the wall clock is set
  Suspend,       ///< the device is suspended
  Network,       ///< the network is gone for a while
  Reboot,        ///< the device reboots
  Upgrade,       ///< the device reboots with another system version
  Stop,          ///< the agent is told to end
  Crash,         ///< the agent dies at some step of changing a file
  PowerLoss,     ///< as a crash, and what was not synced is lost
  ServiceFault,  ///< the service fails for a while
  FileFault,     ///< changes of files fail for a while
  Attestation,   ///< certificates fail for a while
  Damage,        ///< somebody else damages a file
  Setting,       ///< the operator stores a setting
};

/// Something that happens to a device. It is self-contained: leaving out other events does not change it.
struct Event {
  std::size_t number;  ///< in the list for its seed
  double at;           ///< seconds since birth
  EventKind kind;
  std::uint64_t chance;  ///< decides the details
};

const char* nameOf(EventKind kind);
/// The events of `years` years. They come in bursts, so that they overlap.
std::vector<Event> eventsOf(std::uint64_t seed, double years);

}  // namespace kvr::simulate
