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
/// The bus is asked for those that somebody has registered for. A handler is called for each one at once. Of
/// a *row*, notifications without a second's pause, this holds for the first sixteen. What comes on top of
/// them within half a second of the last call is a flood: one call then stands for all of it. So the last
/// notification is always followed by a call, and a flood costs two a second.
class LocalNotifications : public Notifications {
 public:
  static constexpr std::size_t kMostInARow = 16;  ///< that are surely handled each on its own
  static constexpr double kPause = 1;             ///< seconds, after which a new row begins
  static constexpr double kInterval = 0.5;        ///< seconds, from one call of a flood to the next

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
