#pragma once

#include "platform/services/Notifications.h"
#include "platform/services/WorkQueues.h"

#include <map>
#include <string>
#include <utility>

namespace kvr {

/// Notifications posted by the test. `end` drops all registrations.
class SimulatedNotifications : public Notifications {
 public:
  explicit SimulatedNotifications(WorkQueues& queues) : queues_(queues) {}

  Token registerFor(const std::string& name, std::function<void()> handler) override {
    if (refused == name) return 0;
    handlers_.emplace(++last_, std::pair{name, std::move(handler)});
    return last_;
  }
  void cancel(Token token) override {
    // Destroyed only after the map is changed: a handler's destructor may cancel another registration.
    const auto cancelled = handlers_.extract(token);
  }

  void post(const std::string& name) {
    for (const auto& [token, registration] : handlers_) {
      if (registration.first != name) continue;
      queues_.mainQueue()->async([this, token = token] {
        const auto found = handlers_.find(token);
        if (found == handlers_.end()) return;
        const auto handler = found->second.second;
        handler();
      });
    }
  }
  void end() { const auto released = std::exchange(handlers_, {}); }

  std::string refused;  ///< the name of a notification that cannot be registered for

 private:
  WorkQueues& queues_;
  std::map<Token, std::pair<std::string, std::function<void()>>> handlers_;
  Token last_ = 0;
};

}  // namespace kvr
