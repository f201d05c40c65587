#pragma once

#include <cstdint>
#include <functional>
#include <string>

namespace kvr {

/// System-wide named notifications. Any thread.
class Notifications {
 public:
  /// Names one registration; 0 names none.
  using Token = std::int32_t;

  virtual ~Notifications() = default;
  /// Runs `handler` on the main queue whenever the notification is posted. Returns 0 if it cannot be
  /// registered.
  virtual Token registerFor(const std::string& name, std::function<void()> handler) = 0;
  /// The handler is not started any more, and is released.
  virtual void cancel(Token token) = 0;
};

}  // namespace kvr
