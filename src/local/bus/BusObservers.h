#pragma once

#include "local/bus/BusConnection.h"
#include "local/buscodec/BusHandles.h"
#include "platform/log/Log.h"
#include "platform/services/Observers.h"
#include "platform/services/ServiceListener.h"

#include <atomic>
#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <string>

namespace kvr {

/// The interface by which a client asks to be told of changes, and no more: both methods answer whether that
/// is news.
const ServiceInterface& changesInterface();

/// The clients that asked to be told of changes.
///
/// A change goes to each of them as a signal of its own, never to everyone. Behind it goes a call of
/// `Peer.Ping`, which every bus library answers by itself. Until the answer comes, the client may not have
/// read the signal, and whatever changes meanwhile waits here and is told as one change. So a client that
/// does not read costs one signal, and one that is slow is never told what it could not read yet.
///
/// On the bus thread, except for what `Observers` declares.
class BusObservers : public Observers, public std::enable_shared_from_this<BusObservers> {
 public:
  /// The serial numbers in one signal, in bytes. If they need more, the client is told that any device may
  /// have changed.
  static constexpr std::size_t kMostListed = 4096;

  BusObservers(std::shared_ptr<BusThread> thread, Log& log) : thread_(std::move(thread)), log_(log) {}

  bool areThere() const override { return count_ > 0; }
  void tell(const Change& change) override;

  /// False if the connection is told already.
  bool add(sd_bus* bus, const std::string& name);
  /// False if it is not told.
  bool remove(const std::string& name);
  /// Call before the bus is destroyed.
  void close();

 private:
  struct Observer {
    std::string name;
    BusObservers* owner = nullptr;
    sd_bus* bus = nullptr;
    Change untold;
    BusSlotRef question;     ///< whether it has read the last signal
    std::size_t forged = 0;  ///< answers to it that others sent
  };

  static int handleRead(sd_bus_message* message, void* userdata, sd_bus_error* error);
  void tellAll();
  void tellOne(Observer& observer);
  static int send(const Observer& observer);
  static int ask(Observer& observer);
  void lose(std::string name, const std::string& why);

  const std::shared_ptr<BusThread> thread_;
  Log& log_;
  std::map<std::string, Observer, std::less<>> observers_;
  std::atomic<std::size_t> count_ = 0;  ///< of `observers_`

  std::mutex mutex_;  ///< guards what follows
  Change news_;       ///< not handed to the observers yet
};

}  // namespace kvr
