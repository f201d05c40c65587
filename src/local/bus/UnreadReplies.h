#pragma once

#include "local/buscodec/BusHandles.h"
#include "platform/log/Log.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <map>
#include <string>

namespace kvr {

/// What one of many may take of something: much while there is plenty, little once all together have taken a
/// lot, so that whoever asks for little is served then, too.
struct FairLimit {
  std::size_t most;
  std::size_t crowded;  ///< taken by all
  std::size_t fair;

  std::size_t when(std::size_t takenByAll) const { return takenByAll < crowded ? most : fair; }
};

/// How much each peer has been sent that it may not have read yet.
///
/// The bus keeps what a peer does not read, counts it against the sender, and takes nothing more from a
/// sender with too much of it: a single peer that calls and never reads would silence the agent towards
/// everybody. So from time to time the bus is asked how much of a peer's it still holds, and a peer that is
/// too far behind is turned away, in the end without a word. A bus that does not tell is left to its own
/// limits.
///
/// On the bus thread only.
class UnreadReplies {
 public:
  /// What a reply costs beyond its value, here and on the bus.
  static constexpr std::size_t kReply = 1024;
  /// What one peer may leave unread before it is turned away.
  static constexpr FairLimit kLimit{std::size_t{4} << 20, std::size_t{64} << 20, std::size_t{64} << 10};

  explicit UnreadReplies(Log& log) : log_(log) {}

  /// Whether a call is to be served; if not, it has been answered as far as it will be.
  bool admit(sd_bus_message* call);
  /// Whether a peer that was admitted may be sent a value. If so, it counts as sent.
  bool maySend(sd_bus* bus, const std::string& name, const Value& value);
  /// To be called before the bus goes.
  void close() { peers_.clear(); }
  /// The peer has left.
  void forget(const std::string& name);

 private:
  struct Peer {
    std::string name;
    UnreadReplies* owner = nullptr;
    std::size_t unread = 0;      ///< at most
    std::size_t sinceAsked = 0;  ///< part of `unread`
    std::size_t last = 0;  ///< the value sent last, which a peer with one call at a time has to wait for
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
