#pragma once

#include "local/buscodec/BusHandles.h"
#include "platform/log/Log.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <map>
#include <string>

namespace kvr {

/// A limit for each of several users of a shared resource: generous at first, small once the total is high,
/// so that modest users are still served then.
struct FairLimit {
  std::size_t most;
  std::size_t crowded;  ///< total of all users from which `fair` holds
  std::size_t fair;

  std::size_t when(std::size_t takenByAll) const { return takenByAll < crowded ? most : fair; }
};

/// How much each peer has been sent that it may not have read yet.
///
/// The bus keeps what a peer does not read, counts it against the sender, and stops accepting messages from a
/// sender with too much of it: a single peer that calls and never reads would silence the agent for
/// everybody. So the bus is asked from time to time how much it still holds for a peer. A peer that is too
/// far behind gets errors instead of service, and finally no answer at all. If the bus does not report this,
/// its own limits apply.
///
/// On the bus thread only.
class UnreadReplies {
 public:
  /// What a reply costs beyond its value, in bytes, here and on the bus.
  static constexpr std::size_t kReply = 1024;
  /// How many bytes one peer may leave unread before it is turned away.
  static constexpr FairLimit kLimit{std::size_t{4} << 20, std::size_t{64} << 20, std::size_t{64} << 10};

  explicit UnreadReplies(Log& log) : log_(log) {}

  /// Whether to serve a call. If not, it has already been answered, or gets no answer.
  bool admit(sd_bus_message* call);
  /// Whether an admitted peer may be sent this value. If so, it is counted as sent.
  bool maySend(sd_bus* bus, const std::string& name, const Value& value);
  /// Call before the bus is destroyed.
  void close() { peers_.clear(); }
  /// The peer has left.
  void forget(const std::string& name);

 private:
  struct Peer {
    std::string name;
    UnreadReplies* owner = nullptr;
    std::size_t unread = 0;      ///< upper bound, in bytes
    std::size_t sinceAsked = 0;  ///< the part of `unread` sent since the bus was last asked
    std::size_t last = 0;        ///< size of the last value, which a peer with one call at a time waits for
    bool isBehind = false;
    BusSlotRef question;
  };

  static int handleStatistics(sd_bus_message* message, void* userdata, sd_bus_error* error);
  Peer& peerNamed(const char* name);
  void add(sd_bus* bus, Peer& peer, std::size_t bytes);
  void ask(sd_bus* bus, Peer& peer);
  void learn(Peer& peer, std::size_t held);
  void makeRoom();

  Log& log_;
  std::map<std::string, Peer, std::less<>> peers_;
  std::size_t total_ = 0;
};

}  // namespace kvr
