#include "local/bus/UnreadReplies.h"

#include "local/bus/BusCall.h"
#include "local/buscodec/BusCodec.h"

#include <algorithm>
#include <numeric>

namespace kvr {
namespace {

constexpr std::size_t kAskAfter = std::size_t{256} << 10;
constexpr std::size_t kMostPeers = 8192;

/// A rough estimate of a value's size on the bus, in bytes.
std::size_t footprint(const Value& value) {
  constexpr std::size_t kNode = 16;
  switch (value.kind()) {
    case Value::Kind::String:
      return kNode + value.string().size();
    case Value::Kind::Data:
      return kNode + value.data().size();
    case Value::Kind::Array:
      return std::accumulate(value.array().begin(), value.array().end(), kNode,
                             [](std::size_t sum, const Value& one) { return sum + footprint(one); });
    case Value::Kind::Dictionary:
      return std::accumulate(value.dictionary().begin(), value.dictionary().end(), kNode,
                             [](std::size_t sum, const auto& entry) {
                               return sum + entry.first.size() + footprint(entry.second);
                             });
    default:
      return kNode;
  }
}

}  // namespace

bool UnreadReplies::admit(sd_bus_message* call) {
  const char* const sender = sd_bus_message_get_sender(call);
  if (!sender || sd_bus_message_get_expect_reply(call) <= 0) return true;
  sd_bus* const bus = sd_bus_message_get_bus(call);
  Peer& peer = peerNamed(sender);
  const std::size_t limit = kLimit.when(total_);
  const std::size_t behind = peer.unread - std::min(peer.unread, peer.last);
  if (peer.unread >= limit / 2) ask(bus, peer);
  if (behind < limit) {
    peer.isBehind = false;
    add(bus, peer, kReply);
    return true;
  }
  if (!std::exchange(peer.isBehind, true)) {
    log_.error("Connection %@ does not read what it is answered: its calls are turned away", peer.name);
  }
  if (behind < 2 * limit) {
    failBusCall(call, kBusErrorTooMany, "too many replies to this connection are unread");
    add(bus, peer, kReply);
  }
  return false;
}

bool UnreadReplies::maySend(sd_bus* bus, const std::string& name, const Value& value) {
  const std::size_t bytes = footprint(value);
  Peer& peer = peerNamed(name.c_str());
  if (peer.unread > kLimit.most && peer.unread + bytes > kLimit.most + kMaximumBusValueSize) return false;
  peer.last = bytes;
  add(bus, peer, bytes);
  return true;
}

void UnreadReplies::forget(const std::string& name) {
  const auto found = peers_.find(name);
  if (found == peers_.end()) return;
  total_ -= found->second.unread;
  peers_.erase(found);
}

UnreadReplies::Peer& UnreadReplies::peerNamed(const char* name) {
  if (const auto found = peers_.find(std::string_view(name)); found != peers_.end()) return found->second;
  if (peers_.size() >= kMostPeers) makeRoom();
  Peer& peer = peers_[name];
  peer.name = name;
  peer.owner = this;
  return peer;
}

/// Many peers have no `BusClient` whose watch reports that they leave. So those with few unread bytes are
/// dropped.
void UnreadReplies::makeRoom() {
  std::erase_if(peers_, [this](const auto& entry) {
    const Peer& peer = entry.second;
    const bool isLight = !peer.question && peer.unread < kLimit.fair;
    if (isLight) total_ -= peer.unread;
    return isLight;
  });
}

void UnreadReplies::add(sd_bus* bus, Peer& peer, std::size_t bytes) {
  peer.unread += bytes;
  peer.sinceAsked += bytes;
  total_ += bytes;
  if (peer.sinceAsked >= kAskAfter) ask(bus, peer);
}

void UnreadReplies::ask(sd_bus* bus, Peer& peer) {
  if (peer.question) return;
  sd_bus_slot* slot = nullptr;
  sd_bus_call_method_async(bus, &slot, kBusName, kBusPath, "org.freedesktop.DBus.Debug.Stats",
                           "GetConnectionStats", handleStatistics, &peer, "s", peer.name.c_str());
  peer.question.reset(slot);
  peer.sinceAsked = 0;
}

int UnreadReplies::handleStatistics(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    Peer& peer = *static_cast<Peer*>(userdata);
    peer.question.reset();
    UnreadReplies& self = *peer.owner;
    if (!isFromBus(message)) {
      self.ask(sd_bus_message_get_bus(message), peer);
    } else if (sd_bus_message_is_method_error(message, SD_BUS_ERROR_NAME_HAS_NO_OWNER)) {
      self.forget(std::string(peer.name));
    } else {
      const Result<Value> statistics = readBusValue(message, "a{sv}");
      const Value held = statistics ? (*statistics)["OutgoingBytes"] : Value();
      self.learn(peer, held.isNumber() ? static_cast<std::size_t>(held.asInteger()) : 0);
    }
    return 0;
  });
}

void UnreadReplies::learn(Peer& peer, std::size_t held) {
  total_ -= peer.unread;
  peer.unread = held + peer.sinceAsked;
  total_ += peer.unread;
}

}  // namespace kvr
