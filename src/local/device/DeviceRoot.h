#pragma once

#include "platform/stores/PropertyListFiles.h"

#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <system_error>

namespace kvr {

/// The directory that describes the device: one property list per subject, read anew for each request.
///
/// A file that is missing, unreadable or of the wrong type reads as null. A fault of a file is logged once at
/// error level, so callers need not log it. Any thread.
class DeviceRoot {
 public:
  /// KVR_DEVICE_ROOT, or the default directory.
  static std::string directoryFromEnvironment();

  DeviceRoot(PropertyListFiles& lists, Log& log, const std::string& directory = directoryFromEnvironment());

  Value dictionary(std::string_view file) const;
  Value array(std::string_view file) const;
  /// As `dictionary`, but null for a file that anyone but root and the agent's own user could have written:
  /// the file, its directory and the device root must belong to one of the two, and neither group nor others
  /// may have write access. This is checked just before the file is read; whoever could replace it in between
  /// could have passed the check too.
  Value trustedDictionary(std::string_view file) const;

  std::string pathOf(std::string_view file) const { return directory_ + "/" + std::string(file); }
  /// The present stamp of a file, or nothing when it cannot be determined.
  std::optional<FileStamp> stamp(std::string_view file) const {
    const auto stamp = lists_.files().stamp(pathOf(file));
    return stamp ? *stamp : std::nullopt;
  }
  PropertyListFiles& lists() const { return lists_; }

 private:
  std::string resolved(std::string_view file, std::error_code& error) const;
  bool isTrusted(const std::string& path) const;

  PropertyListFiles& lists_;
  Log& log_;
  const std::string directory_;
  mutable std::mutex mutex_;
  mutable std::map<std::string, std::string> resolved_;  ///< by the path as given
  mutable std::map<std::string, std::string> distrust_;  ///< the reason, by the path of each ignored file
};

}  // namespace kvr
