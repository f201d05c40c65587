#pragma once

#include "platform/services/Processes.h"
#include "platform/stores/PropertyListFiles.h"

namespace kvr {

/// Processes by /proc, and bundles: directories that hold an "Info.plist" with a string under
/// "BundleIdentifier".
///
/// A process's executable has a path only while that path leads to the very file that the process runs: it
/// has none once the file was deleted or replaced, nor when the path holds in another mount namespace only.
class LocalProcesses : public Processes {
 public:
  explicit LocalProcesses(PropertyListFiles& lists) : lists_(lists) {}

  std::int64_t executablePath(std::int32_t process, std::span<char> buffer) const override;
  /// The nearest bundle above the executable.
  std::optional<std::string> bundleLocationForExecutable(const std::string& path) const override;
  std::optional<Bundle> bundleAt(const std::string& location) const override;

 private:
  PropertyListFiles& lists_;
};

}  // namespace kvr
