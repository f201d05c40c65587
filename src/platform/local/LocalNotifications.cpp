#include "platform/local/LocalNotifications.h"

#include <string_view>
#include <utility>

namespace kvr {
namespace {

constexpr const char* kPath = "/com/tarsil/NotificationCenter";
constexpr const char* kInterface = "com.tarsil.NotificationCenter";
constexpr const char* kMember = "Posted";

}  // namespace

/// What the bus thread and the main queue use as well.
struct LocalNotifications::State : std::enable_shared_from_this<State> {
  struct Registration {
    std::string name;
    std::shared_ptr<const std::function<void()>> handler;
  };
  using Registrations = std::map<Token, Registration>;

  State(WorkQueues& theQueues, Log& theLog) : queues(theQueues), log(theLog) {}

  /// On the bus thread.
  void deliver(std::string_view name) {
    std::vector<Token> tokens;
    bool isFull = false;
    {
      const std::lock_guard lock(mutex);
      for (const auto& [token, registration] : registrations) {
        if (registration.name != name) continue;
        if (waiting == kMostWaiting) {
          isFull = !std::exchange(dropping, true);
          break;
        }
        ++waiting;
        tokens.push_back(token);
      }
    }
    if (isFull) log.error("Too many notifications wait to be handled: '%@' is dropped", std::string(name));
    for (const auto token : tokens) {
      queues.mainQueue()->async([self = shared_from_this(), token] { self->handle(token); });
    }
  }

  void handle(Token token) {
    std::shared_ptr<const std::function<void()>> handler;
    {
      const std::lock_guard lock(mutex);
      if (--waiting == 0) dropping = false;
      if (const auto found = registrations.find(token); found != registrations.end()) {
        handler = found->second.handler;
      }
    }
    if (handler) (*handler)();
  }

  WorkQueues& queues;
  Log& log;
  BusSlotRef slot;   ///< the bus thread's
  std::mutex mutex;  ///< guards what follows
  Registrations registrations;
  Token last = 0;
  std::size_t waiting = 0;
  bool dropping = false;  ///< since the main queue last caught up
};

LocalNotifications::LocalNotifications(BusConnection& bus, WorkQueues& queues, Log& log)
    : bus_(bus), state_(std::make_shared<State>(queues, log)) {}

LocalNotifications::~LocalNotifications() {
  beginEnding();
  bus_.thread()->post([state = state_] { state->slot.reset(); });
}

LocalNotifications::Token LocalNotifications::registerFor(const std::string& name,
                                                          std::function<void()> handler) {
  Token token = 0;
  {
    const std::lock_guard lock(state_->mutex);
    token = ++state_->last;
    state_->registrations.emplace(
        token, State::Registration{name, std::make_shared<const std::function<void()>>(std::move(handler))});
  }
  bus_.thread()->post([state = state_, &bus = bus_] {
    sd_bus* const connection = state->slot ? nullptr : bus.bus();
    if (connection == nullptr) return;
    sd_bus_slot* slot = nullptr;
    const int r = sd_bus_match_signal_async(connection, &slot, nullptr, kPath, kInterface, kMember,
                                            handlePosted, nullptr, state.get());
    if (r >= 0) {
      state->slot.reset(slot);
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

int LocalNotifications::handlePosted(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    const char* name = nullptr;
    if (sd_bus_message_read(message, "s", &name) >= 0) static_cast<State*>(userdata)->deliver(name);
    return 0;
  });
}

}  // namespace kvr
