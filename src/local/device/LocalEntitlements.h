#pragma once

#include "local/device/DeviceRoot.h"

#include <cstdint>

namespace kvr {

/// Identifies an executable file, whatever path leads to it.
struct FileIdentity {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;

  /// The identity of the file that a path leads to.
  static std::optional<FileIdentity> of(const std::string& path);

  friend bool operator==(const FileIdentity&, const FileIdentity&) = default;
};

/// The entitlements that "Entitlements.plist" grants to executables. It names them by absolute path; entitled
/// are the files that those paths lead to when the question is asked. Any thread.
class LocalEntitlements {
 public:
  explicit LocalEntitlements(const DeviceRoot& root) : root_(root) {}

  /// The value of an entitlement, with the type it has in the file; null when it is not granted.
  Value valueFor(const FileIdentity& executable, std::string_view entitlement) const;

 private:
  const DeviceRoot& root_;
};

}  // namespace kvr
