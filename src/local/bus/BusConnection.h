#pragma once

#include "local/buscodec/BusHandles.h"
#include "platform/log/Log.h"
#include "platform/services/WorkQueues.h"
#include "platform/value/Error.h"

#include <functional>
#include <memory>
#include <mutex>
#include <thread>

namespace kvr {

class EventLoop;

/// The way to a bus thread, for whoever may outlive it.
class BusThread {
 public:
  /// Runs `work` on the bus thread, in the order posted; once that thread has ended, it is let go where it
  /// is. Any thread.
  void post(Work work);

 private:
  friend class BusConnection;
  void setLoop(EventLoop* loop);

  std::mutex mutex_;
  EventLoop* loop_ = nullptr;
};

/// A connection to the session bus on a thread of its own, the only one that touches it.
///
/// The thread sleeps until something is posted or a message arrives. What lives on the bus (slots, messages)
/// must be let go before the connection ends.
class BusConnection {
 public:
  /// Starts the thread. `lost` is called on it, once, when the bus cannot be reached or goes away.
  BusConnection(Log& log, std::function<void(const Error&)> lost);
  /// Runs what was posted, sends what waits to be sent (for some seconds at most) and ends the thread.
  ~BusConnection();
  BusConnection(const BusConnection&) = delete;
  BusConnection& operator=(const BusConnection&) = delete;

  const std::shared_ptr<BusThread>& thread() const { return thread_; }
  /// The bus, connected at the first use; null once it is lost. On the bus thread only.
  sd_bus* bus();

 private:
  void run(const std::function<void()>& started);
  int connect();
  void lose(const Error& error);
  void sendWhatWaits();
  static int handleDisconnected(sd_bus_message* message, void* userdata, sd_bus_error* error);

  const std::shared_ptr<BusThread> thread_ = std::make_shared<BusThread>();
  Log& log_;
  std::function<void(const Error&)> lost_;
  EventLoop* loop_ = nullptr;
  BusRef bus_;
  BusSlotRef disconnected_;
  bool isLost_ = false;
  std::thread runner_;
};

}  // namespace kvr
