#pragma once

#include "platform/Platform.h"

#include <cstdint>
#include <optional>

namespace kvr {

/// Decides which connections are served and binds each to an agent of its own. Holds no state.
class ServiceDelegate : public ServiceListenerDelegate {
 public:
  explicit ServiceDelegate(Platform& platform) : platform_(platform) {}

  /// Accepts a peer that holds the entitlement as a true number. One whose bundle cannot be told is served
  /// too.
  bool shouldAcceptNewConnection(ServiceConnection& connection) override;

  /// The application bundle that contains the process's executable, or nothing.
  std::optional<Bundle> _bundleForPID(std::int32_t process) const;

 private:
  Platform& platform_;
};

}  // namespace kvr
