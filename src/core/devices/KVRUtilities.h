#pragma once

#include "platform/Platform.h"

namespace kvr {

class KVRUtilities {
 public:
  /// Whether this is an internal (engineering) installation, on which debugging overrides count. Read afresh
  /// by every call. Any thread.
  static bool isInternal(Platform& platform) { return platform.deviceProperties.isInternalInstall(); }
};

}  // namespace kvr
