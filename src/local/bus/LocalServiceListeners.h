#pragma once

#include "local/bus/BusConnection.h"
#include "local/bus/BusObservers.h"
#include "local/device/LocalEntitlements.h"
#include "platform/log/Log.h"
#include "platform/services/ServiceListener.h"
#include "platform/services/WorkQueues.h"

#include <atomic>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace kvr {

class BusService;

/// Services on the session bus. A listener's name is a well-known name, its object has the path that the name
/// spells, and each unique name on the bus is one connection.
///
/// All listeners share one connection to the bus, with its own thread, opened when the first listener is
/// resumed. Destroy the listeners first.
class LocalServiceListeners : public ServiceListeners {
 public:
  /// `busLost` is called once, on the bus thread, when the bus cannot be reached, is lost, or refuses a
  /// listener its name or takes it away; an error line has been logged by then. It must not wait for this
  /// object.
  LocalServiceListeners(WorkQueues& queues, Log& log, const LocalEntitlements& entitlements,
                        std::function<void()> busLost);
  /// Sends the replies already given, for as long as the bus takes them within 2 seconds.
  ~LocalServiceListeners() override;

  std::unique_ptr<ServiceListener> newListener(std::string name) override;

  /// Releases the names, so that a new call starts or reaches another agent. Returns once every call that
  /// came through them has been taken in; later calls get an error. Waits for the bus a few seconds at most.
  /// Not on the bus thread.
  void beginEnding();
  /// The shared connection, for other users of the bus; they must be destroyed before this object.
  BusConnection& connection() { return connection_; }
  /// The clients that asked to be told of changes.
  Observers& observers() { return *observers_; }
  /// Whether the bus, or the service manager behind it, starts an agent when somebody calls this name. Waits
  /// for the bus a few seconds at most. Not on the bus thread.
  bool isActivatable(const std::string& name);
  /// How many calls have not been answered yet. Any thread.
  std::size_t openCalls() const { return *openCalls_; }

 private:
  class Listener;

  void open(const std::shared_ptr<BusService>& service);
  void close(const std::shared_ptr<BusService>& service);
  void lose(const Error& error);

  WorkQueues& queues_;
  Log& log_;
  const LocalEntitlements& entitlements_;
  std::function<void()> busLost_;
  const std::shared_ptr<std::atomic<std::size_t>> openCalls_ = std::make_shared<std::atomic<std::size_t>>(0);
  std::vector<std::shared_ptr<BusService>> services_;  ///< used on the bus thread
  BusConnection connection_;                           ///< destroyed first, but for what only posts to it
  const std::shared_ptr<BusObservers> observers_;
};

}  // namespace kvr
