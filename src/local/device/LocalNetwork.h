#pragma once

#include "local/device/DeviceRoot.h"
#include "local/loop/FileWatch.h"

#include <functional>
#include <string>

namespace kvr {

/// Whether the network can be reached: as "Network.plist" says, else as the host's network service does, else
/// it can. Built and destroyed on the loop's thread.
class LocalNetwork {
 public:
  /// Where systemd-networkd publishes the state of all links together.
  static constexpr const char* kHostState = "/run/systemd/netif/state";

  /// `changed` is called on the loop's thread, with the answer, when it may have changed.
  LocalNetwork(EventLoop& loop, Log& log, const DeviceRoot& root,
               const std::function<void(bool reachable)>& changed, std::string hostState = kHostState);

  /// The answer now. Any thread.
  bool isReachable() const;
  /// The answer by what "Network.plist" holds, or null, and by the host's state. Any thread.
  static bool isReachable(const Value& described, const std::string& hostState = kHostState);

 private:
  const DeviceRoot& root_;
  const std::string hostState_;
  FileWatch ownWatch_;
  FileWatch hostWatch_;
};

}  // namespace kvr
