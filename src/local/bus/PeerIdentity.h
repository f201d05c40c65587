#pragma once

#include "local/device/LocalEntitlements.h"
#include "local/system/Descriptor.h"
#include "platform/value/Error.h"

#include <cstdint>

namespace kvr {

/// Which program a process runs, bound to that very process rather than to its number, which another process
/// may get once this one has ended.
///
/// The process handle (pidfd) is opened before the executable is looked up. So while `isAlive` is true,
/// everything learnt by the number in between is about this process.
class PeerIdentity {
 public:
  /// An error in domain "process" when there is no such process or its program cannot be determined. Any
  /// thread.
  static Result<PeerIdentity> of(std::int32_t process);

  const FileIdentity& executable() const { return executable_; }
  bool isAlive() const;

 private:
  PeerIdentity(Descriptor process, FileIdentity executable)
      : process_(std::move(process)), executable_(executable) {}

  Descriptor process_;
  FileIdentity executable_;
};

}  // namespace kvr
