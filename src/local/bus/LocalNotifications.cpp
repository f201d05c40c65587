#include "local/bus/LocalNotifications.h"

#include "platform/names/Names.h"

#include <chrono>
#include <optional>
#include <string_view>
#include <utility>

namespace kvr {
namespace {

using Clock = std::chrono::steady_clock;

double secondsBetween(Clock::time_point from, Clock::time_point until) {
  return std::chrono::duration<double>(until - from).count();
}

}  // namespace

/// State shared by the bus thread and the main queue.
struct LocalNotifications::State : std::enable_shared_from_this<State> {
  struct Registration {
    std::string name;
    std::shared_ptr<const std::function<void()>> handler;
    std::size_t inARow = 0;       ///< notifications in the present row
    Clock::time_point last;       ///< when the last one arrived
    Clock::time_point called;     ///< when the handler was last called
    std::size_t callsToCome = 0;  ///< calls handed to the main queue
    bool isFlooded = false;       ///< one of those calls stands for all notifications before it
    bool isFloodTold = false;     ///< the flood of this row has been logged
  };
  using Registrations = std::map<Token, Registration>;
  /// A call of a handler after `delay` seconds.
  struct Call {
    Token token;
    double delay;
    bool isOfFlood;
    bool isNews;  ///< the first call of a flood, to be logged
  };

  State(WorkQueues& theQueues, Log& theLog) : queues(theQueues), log(theLog) {}

  /// On the bus thread.
  void deliver(std::string_view name) {
    std::vector<Call> calls;
    {
      const std::lock_guard lock(mutex);
      const auto now = Clock::now();
      for (auto& [token, registration] : registrations) {
        if (registration.name != name) continue;
        if (const auto call = callFor(token, registration, now)) calls.push_back(*call);
      }
    }
    for (const auto& call : calls) {
      if (call.isNews) {
        log.standard("Notifications %@ come in a flood, those beyond %d in a row are taken together",
                     std::string(name), static_cast<int>(kMostInARow));
      }
      Work work = [self = shared_from_this(), call] { self->handle(call); };
      if (call.delay > 0) {
        queues.after(call.delay, queues.mainQueue(), std::move(work));
      } else {
        queues.mainQueue()->async(std::move(work));
      }
    }
  }

  /// Nothing when a call already under way stands for this notification too.
  static std::optional<Call> callFor(Token token, Registration& registration, Clock::time_point now) {
    if (secondsBetween(registration.last, now) > kPause) {
      registration.inARow = 0;
      registration.isFloodTold = false;
    }
    registration.last = now;
    ++registration.inARow;
    const double rest = kInterval - secondsBetween(registration.called, now);
    const bool isOwn = (registration.inARow <= kMostInARow || rest <= 0) &&
                       registration.callsToCome < kMostInARow && !registration.isFlooded;
    if (!isOwn && std::exchange(registration.isFlooded, true)) return std::nullopt;
    ++registration.callsToCome;
    return Call{token, isOwn ? 0 : rest, !isOwn, !isOwn && !std::exchange(registration.isFloodTold, true)};
  }

  void handle(const Call& call) {
    std::shared_ptr<const std::function<void()>> handler;
    {
      const std::lock_guard lock(mutex);
      if (const auto found = registrations.find(call.token); found != registrations.end()) {
        Registration& registration = found->second;
        handler = registration.handler;
        registration.called = Clock::now();
        --registration.callsToCome;
        if (call.isOfFlood) registration.isFlooded = false;
      }
    }
    if (handler) (*handler)();
  }

  WorkQueues& queues;
  Log& log;
  std::map<std::string, BusSlotRef> slots;  ///< by name; used on the bus thread
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
    State::Registration registration;
    registration.name = name;
    registration.handler = std::make_shared<const std::function<void()>>(std::move(handler));
    state_->registrations.emplace(token, std::move(registration));
  }
  bus_.thread()->post([state = state_, &bus = bus_, name] {
    sd_bus* const connection = state->slots.contains(name) ? nullptr : bus.bus();
    if (connection == nullptr) return;
    std::string rule = "type='signal',path='";
    rule.append(names::kNotificationPath)
        .append("',interface='")
        .append(names::kNotificationInterface)
        .append("',member='")
        .append(names::kNotificationMember);
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
  // Destroyed after the lock is released: a handler's destructor may cancel another registration.
  State::Registrations::node_type cancelled;
  const std::lock_guard lock(state_->mutex);
  cancelled = state_->registrations.extract(token);
}

void LocalNotifications::post(const std::string& name) {
  bus_.thread()->post([&bus = bus_, name] {
    if (sd_bus* const connection = bus.bus()) {
      sd_bus_emit_signal(connection, names::kNotificationPath, names::kNotificationInterface,
                         names::kNotificationMember, "s", name.c_str());
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
