#pragma once

#include "platform/local/Descriptor.h"
#include "platform/local/DeviceRoot.h"
#include "platform/local/EventLoop.h"

#include <functional>
#include <string>

namespace kvr {

/// Whether the network can be reached, as "Network.plist" says; without that file it can.
///
/// The directory is watched, not asked again and again; one that does not exist yet is waited for in the
/// nearest one that does. Built and destroyed on the loop's thread.
class LocalNetwork {
 public:
  /// `changed` is called on the loop's thread, with the answer, when it may have changed. Throws
  /// std::system_error when the kernel refuses.
  LocalNetwork(EventLoop& loop, const DeviceRoot& root, std::function<void(bool reachable)> changed);
  ~LocalNetwork();
  LocalNetwork(const LocalNetwork&) = delete;
  LocalNetwork& operator=(const LocalNetwork&) = delete;

  /// The answer now. Any thread.
  bool isReachable() const;

 private:
  void watch();
  void readEvents();

  const DeviceRoot& root_;
  const std::function<void(bool)> changed_;
  Descriptor inotify_;
  sd_event_source* source_ = nullptr;
  int watch_ = -1;
  bool isWatchingRoot_ = false;
};

}  // namespace kvr
