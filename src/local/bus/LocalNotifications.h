#pragma once

#include "local/bus/BusConnection.h"
#include "platform/log/Log.h"
#include "platform/services/Notifications.h"
#include "platform/services/WorkQueues.h"

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace kvr {

/// Notifications as signals on the session bus, which anyone on it may send:
/// `com.tarsil.NotificationCenter.Posted` from `/com/tarsil/NotificationCenter`, with the name.
///
/// Only the notifications that somebody has registered for are subscribed to on the bus. Normally each one
/// calls the handler at once. A *row* is a series of notifications without a pause of a second: its first
/// sixteen are handled one by one. Any further one within half a second of the last call counts as a flood,
/// and one call stands for all of it. So a flood costs two calls a second, and a call always follows the last
/// notification.
class LocalNotifications : public Notifications {
 public:
  static constexpr std::size_t kMostInARow = 16;  ///< notifications of a row, each handled on its own
  static constexpr double kPause = 1;             ///< seconds without one, after which a new row begins
  static constexpr double kInterval = 0.5;        ///< seconds from one call to the next during a flood

  /// The bus must outlive this.
  LocalNotifications(BusConnection& bus, WorkQueues& queues, Log& log);
  ~LocalNotifications() override;
  LocalNotifications(const LocalNotifications&) = delete;
  LocalNotifications& operator=(const LocalNotifications&) = delete;

  Token registerFor(const std::string& name, std::function<void()> handler) override;
  void cancel(Token token) override;
  /// Sends a notification to everyone on the bus, including the registrations of this process.
  void post(const std::string& name);
  /// Drops all handlers.
  void beginEnding();

 private:
  struct State;
  static int handleWatched(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handlePosted(sd_bus_message* message, void* userdata, sd_bus_error* error);

  BusConnection& bus_;
  const std::shared_ptr<State> state_;
};

}  // namespace kvr
