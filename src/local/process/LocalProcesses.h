#pragma once

#include "platform/services/Processes.h"
#include "platform/stores/PropertyListFiles.h"

namespace kvr {

/// Processes as /proc shows them, and bundles: directories with an "Info.plist" that has a string under
/// "BundleIdentifier".
///
/// An executable's path is known only while it leads to the very file that the process runs: not after the
/// file was deleted or replaced, and not if the path is valid in another mount namespace only.
class LocalProcesses : public Processes {
 public:
  explicit LocalProcesses(PropertyListFiles& lists) : lists_(lists) {}

  std::int64_t executablePath(std::int32_t process, std::span<char> buffer) const override;
  /// The innermost bundle that contains the executable.
  std::optional<std::string> bundleLocationForExecutable(const std::string& path) const override;
  std::optional<Bundle> bundleAt(const std::string& location) const override;

 private:
  PropertyListFiles& lists_;
};

}  // namespace kvr
