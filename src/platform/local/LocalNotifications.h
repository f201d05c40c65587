#pragma once

#include "platform/Log.h"
#include "platform/Notifications.h"
#include "platform/WorkQueues.h"
#include "platform/local/BusConnection.h"

#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace kvr {

/// Notifications as signals on the session bus, which anyone on it may send:
/// `com.tarsil.NotificationCenter.Posted` from `/com/tarsil/NotificationCenter`, with the name.
///
/// The bus is asked for those that somebody has registered for. A handler is called at once, but not again
/// within half a second of the last time: what comes meanwhile is one call then. So the last notification is
/// always followed by a call, and a flood costs two a second.
class LocalNotifications : public Notifications {
 public:
  static constexpr double kInterval = 0.5;  ///< seconds

  /// The bus must outlive this.
  LocalNotifications(BusConnection& bus, WorkQueues& queues, Log& log);
  ~LocalNotifications() override;
  LocalNotifications(const LocalNotifications&) = delete;
  LocalNotifications& operator=(const LocalNotifications&) = delete;

  Token registerFor(const std::string& name, std::function<void()> handler) override;
  void cancel(Token token) override;
  /// Sends a notification to everyone on the bus, registrations here included.
  void post(const std::string& name);
  /// Lets all handlers go.
  void beginEnding();

 private:
  struct State;
  static int handleWatched(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handlePosted(sd_bus_message* message, void* userdata, sd_bus_error* error);

  BusConnection& bus_;
  const std::shared_ptr<State> state_;
};

}  // namespace kvr
