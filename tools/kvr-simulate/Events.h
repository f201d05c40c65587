#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace kvr::simulate {

enum class EventKind {
  Call,          ///< a client asks something
  Offer,         ///< the service changes what it says of a device
  Watch,         ///< a watch is paired, unpaired, archived or taken back
  Account,       ///< the owner signs in or out
  Token,         ///< the service no longer takes the account's token
  Locale,        ///< another language
  Clock,         ///< the wall clock is set
  Suspend,       ///< the device sleeps
  Network,       ///< the network goes for a while
  Reboot,        ///< the device starts anew
  Upgrade,       ///< and with another system
  Stop,          ///< the agent is told to end
  Crash,         ///< the agent dies at some step of a change of a file
  PowerLoss,     ///< and what was not synced with it
  ServiceFault,  ///< the service fails for a while
  FileFault,     ///< changes of files fail for a while
  Attestation,   ///< certificates fail for a while
  Damage,        ///< somebody else spoils a file
  Setting,       ///< the operator stores a setting
};

/// Something that happens to a device: complete in itself, so that leaving others out does not change it.
struct Event {
  std::size_t number;  ///< in the list of its seed
  double at;           ///< seconds since birth
  EventKind kind;
  std::uint64_t chance;  ///< decides the details
};

const char* nameOf(EventKind kind);
/// What happens in so many years: in bursts, so that one thing comes in the midst of another.
std::vector<Event> eventsOf(std::uint64_t seed, double years);

}  // namespace kvr::simulate
