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

/// Posts work to a bus thread; may outlive it.
class BusThread {
 public:
  /// Runs `work` on the bus thread, in the order posted. Once that thread has ended, `work` is dropped. Any
  /// thread.
  void post(Work work);

 private:
  friend class BusConnection;
  void setLoop(EventLoop* loop);

  std::mutex mutex_;
  EventLoop* loop_ = nullptr;
};

/// A connection to the session bus with its own thread, the only one that uses it.
///
/// The thread sleeps until something is posted or a message arrives. Release every slot and message before
/// the connection is destroyed.
class BusConnection {
 public:
  /// Starts the thread. `lost` is called once, on that thread, when the bus cannot be reached or goes away.
  BusConnection(Log& log, std::function<void(const Error&)> lost);
  /// Runs posted work, sends queued messages (for at most 2 seconds) and ends the thread.
  ~BusConnection();
  BusConnection(const BusConnection&) = delete;
  BusConnection& operator=(const BusConnection&) = delete;

  const std::shared_ptr<BusThread>& thread() const { return thread_; }
  /// The bus; connects on first use. Null once the bus is lost. On the bus thread only.
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
