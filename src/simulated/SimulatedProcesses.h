#pragma once

#include "platform/services/Processes.h"

#include <algorithm>
#include <map>
#include <utility>

namespace kvr {

class SimulatedProcesses : public Processes {
 public:
  std::map<std::int32_t, std::string> executables;     ///< by process identifier
  std::map<std::string, std::string> bundleLocations;  ///< by path of the executable
  std::map<std::string, Bundle> bundles;               ///< by location

  /// Adds a running program that belongs to a bundle.
  void add(std::int32_t process, const std::string& executable, Bundle bundle) {
    executables[process] = executable;
    bundleLocations[executable] = bundle.location;
    const std::string location = bundle.location;
    bundles[location] = std::move(bundle);
  }

  std::int64_t executablePath(std::int32_t process, std::span<char> buffer) const override {
    const auto found = executables.find(process);
    if (found == executables.end() || found->second.size() > buffer.size()) return 0;
    std::copy(found->second.begin(), found->second.end(), buffer.begin());
    return static_cast<std::int64_t>(found->second.size());
  }
  std::optional<std::string> bundleLocationForExecutable(const std::string& path) const override {
    return lookUp(bundleLocations, path);
  }
  std::optional<Bundle> bundleAt(const std::string& location) const override {
    return lookUp(bundles, location);
  }

 private:
  template <class T>
  static std::optional<T> lookUp(const std::map<std::string, T>& table, const std::string& key) {
    const auto found = table.find(key);
    return found == table.end() ? std::nullopt : std::optional(found->second);
  }
};

}  // namespace kvr
