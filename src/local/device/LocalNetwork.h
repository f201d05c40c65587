#pragma once

#include "local/device/DeviceRoot.h"
#include "local/loop/FileWatch.h"

#include <functional>
#include <string>

namespace kvr {

/// Whether the network is reachable: as stated in "Network.plist", else by the host's network service, else
/// yes. Built and destroyed on the loop's thread.
class LocalNetwork {
 public:
  /// Where systemd-networkd publishes the combined state of all links.
  static constexpr const char* kHostState = "/run/systemd/netif/state";

  /// `changed` is called on the loop's thread with the present state, when it may have changed.
  LocalNetwork(EventLoop& loop, Log& log, const DeviceRoot& root,
               const std::function<void(bool reachable)>& changed, std::string hostState = kHostState);

  /// The present state. Any thread.
  bool isReachable() const;
  /// The state by the contents of "Network.plist" (null if there are none) and the host's state. Any thread.
  static bool isReachable(const Value& described, const std::string& hostState = kHostState);

 private:
  const DeviceRoot& root_;
  const std::string hostState_;
  FileWatch ownWatch_;
  FileWatch hostWatch_;
};

}  // namespace kvr
