#pragma once

#include "local/bus/BusConnection.h"
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

/// Services on the session bus: a listener's name is a well-known name, its object has the path that the name
/// spells, and a connection is a unique name on the bus.
///
/// All of it shares one connection to the bus, which has a thread of its own and is opened when the first
/// listener is resumed. Listeners must be gone before this is.
class LocalServiceListeners : public ServiceListeners {
 public:
  /// `busLost` is called once, on the bus thread, when the bus cannot be reached, is lost, or does not give
  /// or leave a listener its name; an error line has said so then. It must not wait for this object.
  LocalServiceListeners(WorkQueues& queues, Log& log, const LocalEntitlements& entitlements,
                        std::function<void()> busLost);
  /// What has been answered is sent, if the bus takes it within some seconds.
  ~LocalServiceListeners() override;

  std::unique_ptr<ServiceListener> newListener(std::string name) override;

  /// Gives the names up, so that a new call starts or finds another agent, and returns when every call that
  /// came through them is on its way; later ones are answered with an error. Waits for the bus some seconds
  /// at most. Not on the bus thread.
  void beginEnding();
  /// The connection that all of it shares, for others that live on the bus and end before this does.
  BusConnection& connection() { return connection_; }
  /// Whether the bus, or the service manager behind it, starts an agent when somebody calls this name. Waits
  /// for the bus some seconds at most. Not on the bus thread.
  bool isActivatable(const std::string& name);
  /// How many calls have come and are not answered yet. Any thread.
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
  std::vector<std::shared_ptr<BusService>> services_;  ///< the bus thread's
  BusConnection connection_;                           ///< ends before the rest
};

}  // namespace kvr
