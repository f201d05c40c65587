#include "platform/local/LocalNotifications.h"

#include <chrono>
#include <string_view>
#include <utility>

namespace kvr {
namespace {

constexpr const char* kPath = "/com/tarsil/NotificationCenter";
constexpr const char* kInterface = "com.tarsil.NotificationCenter";
constexpr const char* kMember = "Posted";

using Clock = std::chrono::steady_clock;

}  // namespace

/// What the bus thread and the main queue use as well.
struct LocalNotifications::State : std::enable_shared_from_this<State> {
  struct Registration {
    std::string name;
    std::shared_ptr<const std::function<void()>> handler;
    bool isDue = false;       ///< its handler is to be called
    Clock::time_point rests;  ///< until then it is not called
  };
  using Registrations = std::map<Token, Registration>;

  State(WorkQueues& theQueues, Log& theLog) : queues(theQueues), log(theLog) {}

  /// On the bus thread.
  void deliver(std::string_view name) {
    std::vector<std::pair<Token, double>> due;
    {
      const std::lock_guard lock(mutex);
      const auto now = Clock::now();
      for (auto& [token, registration] : registrations) {
        if (registration.name != name || std::exchange(registration.isDue, true)) continue;
        due.emplace_back(token, std::chrono::duration<double>(registration.rests - now).count());
      }
    }
    for (const auto& [token, delay] : due) {
      Work work = [self = shared_from_this(), key = token] { self->handle(key); };
      if (delay > 0) {
        queues.after(delay, queues.mainQueue(), std::move(work));
      } else {
        queues.mainQueue()->async(std::move(work));
      }
    }
  }

  void handle(Token token) {
    std::shared_ptr<const std::function<void()>> handler;
    {
      const std::lock_guard lock(mutex);
      if (const auto found = registrations.find(token); found != registrations.end()) {
        Registration& registration = found->second;
        handler = registration.handler;
        registration.isDue = false;
        registration.rests = Clock::now() + std::chrono::duration_cast<Clock::duration>(
                                                std::chrono::duration<double>(kInterval));
      }
    }
    if (handler) (*handler)();
  }

  WorkQueues& queues;
  Log& log;
  std::map<std::string, BusSlotRef> slots;  ///< by name; the bus thread's
  std::mutex mutex;                         ///< guards what follows
  Registrations registrations;
  Token last = 0;
};

LocalNotifications::LocalNotifications(BusConnection& bus, WorkQueues& queues, Log& log)
    : bus_(bus), state_(std::make_shared<State>(queues, log)) {}

LocalNotifications::~LocalNotifications() {
  beginEnding();
  bus_.thread()->post([state = state_] { state->slots.clear(); });
}

LocalNotifications::Token LocalNotifications::registerFor(const std::string& name,
                                                          std::function<void()> handler) {
  Token token = 0;
  {
    const std::lock_guard lock(state_->mutex);
    token = ++state_->last;
    state_->registrations.emplace(
        token, State::Registration{
                   name, std::make_shared<const std::function<void()>>(std::move(handler)), false, {}});
  }
  bus_.thread()->post([state = state_, &bus = bus_, name] {
    sd_bus* const connection = state->slots.contains(name) ? nullptr : bus.bus();
    if (connection == nullptr) return;
    std::string rule = "type='signal',path='";
    rule.append(kPath).append("',interface='").append(kInterface).append("',member='").append(kMember);
    rule.append("',arg0='").append(name).append("'");
    sd_bus_slot* slot = nullptr;
    const int r =
        sd_bus_add_match_async(connection, &slot, rule.c_str(), handlePosted, handleWatched, state.get());
    if (r >= 0) {
      state->slots[name].reset(slot);
    } else {
      state->log.error("Notifications cannot be received: %@", busError(r, "the bus refuses"));
    }
  });
  return token;
}

void LocalNotifications::cancel(Token token) {
  // Let go outside the lock: a handler's end may cancel another.
  State::Registrations::node_type cancelled;
  const std::lock_guard lock(state_->mutex);
  cancelled = state_->registrations.extract(token);
}

void LocalNotifications::post(const std::string& name) {
  bus_.thread()->post([&bus = bus_, name] {
    if (sd_bus* const connection = bus.bus()) {
      sd_bus_emit_signal(connection, kPath, kInterface, kMember, "s", name.c_str());
    }
  });
}

void LocalNotifications::beginEnding() {
  State::Registrations released;
  const std::lock_guard lock(state_->mutex);
  released.swap(state_->registrations);
}

int LocalNotifications::handleWatched(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    const sd_bus_error* const error = sd_bus_message_get_error(message);
    if (error && isFromBus(message)) {
      static_cast<State*>(userdata)->log.error("Notifications cannot be received: %@",
                                               std::string(error->message ? error->message : error->name));
    }
    return 0;
  });
}

int LocalNotifications::handlePosted(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    const char* name = nullptr;
    if (sd_bus_message_read(message, "s", &name) >= 0) static_cast<State*>(userdata)->deliver(name);
    return 0;
  });
}

}  // namespace kvr
