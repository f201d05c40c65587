#pragma once

#include "platform/Platform.h"

#include <cstdint>
#include <optional>

namespace kvr {

/// Decides which connections are served, and gives each its own agent. No state.
class ServiceDelegate : public ServiceListenerDelegate {
 public:
  explicit ServiceDelegate(Platform& platform) : platform_(platform) {}

  /// Accepts a peer whose program has the entitlement with a true value (bool or number). A peer whose bundle
  /// cannot be determined is accepted too.
  bool shouldAcceptNewConnection(ServiceConnection& connection) override;

  /// The application bundle that contains the process's executable, or nothing.
  std::optional<Bundle> _bundleForPID(std::int32_t process) const;

 private:
  Platform& platform_;
};

}  // namespace kvr
