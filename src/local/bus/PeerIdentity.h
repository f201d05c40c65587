#pragma once

#include "local/device/LocalEntitlements.h"
#include "local/system/Descriptor.h"
#include "platform/value/Error.h"

#include <cstdint>

namespace kvr {

/// Which program a process runs, held to the very process: its number may be taken by another once it has
/// ended.
///
/// The process is held before its executable is looked up, so as long as `isAlive`, everything that was
/// learnt by its number in between was learnt of this process.
class PeerIdentity {
 public:
  /// An error in domain "process" when there is no such process or its program cannot be told. Any thread.
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
