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
  /// Has `handler` run on the main queue whenever somebody posts the notification. 0 when that cannot be.
  virtual Token registerFor(const std::string& name, std::function<void()> handler) = 0;
  /// From here on the handler does not begin any more; it is let go.
  virtual void cancel(Token token) = 0;
};

}  // namespace kvr
