#pragma once

#include "local/device/DeviceRoot.h"

#include <cstdint>

namespace kvr {

/// Which file an executable is, whatever path leads to it.
struct FileIdentity {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;

  /// Of the file that a path leads to.
  static std::optional<FileIdentity> of(const std::string& path);

  friend bool operator==(const FileIdentity&, const FileIdentity&) = default;
};

/// What "Entitlements.plist" grants to executables. It names them by absolute path, but it is the files that
/// those paths lead to at the time of asking that are entitled. Any thread.
class LocalEntitlements {
 public:
  explicit LocalEntitlements(const DeviceRoot& root) : root_(root) {}

  /// The value of an entitlement, of the kind it is stated in; null when it is not granted.
  Value valueFor(const FileIdentity& executable, std::string_view entitlement) const;

 private:
  const DeviceRoot& root_;
};

}  // namespace kvr
