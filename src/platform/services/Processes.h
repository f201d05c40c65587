#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>

namespace kvr {

/// An application bundle and what its property list says of it.
struct Bundle {
  std::string location;
  std::optional<std::string> identifier;
};

/// Running programs and the application bundles they belong to. Any thread.
class Processes {
 public:
  virtual ~Processes() = default;
  /// Writes the path of a process's executable (UTF-8, unterminated) and returns its length in bytes; 0 or
  /// less on failure.
  virtual std::int64_t executablePath(std::int32_t process, std::span<char> buffer) const = 0;
  /// The location of the bundle that encloses an executable, or nothing.
  virtual std::optional<std::string> bundleLocationForExecutable(const std::string& path) const = 0;
  virtual std::optional<Bundle> bundleAt(const std::string& location) const = 0;
};

}  // namespace kvr
