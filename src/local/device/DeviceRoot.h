#pragma once

#include "platform/stores/PropertyListFiles.h"

#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <system_error>

namespace kvr {

/// The directory that describes the device: one property list a subject, read afresh at every question.
///
/// A file that is missing or cannot be read as what it should be is an absent answer: null. What is wrong
/// with a file is reported once at error level, not by the one who asks. Any thread.
class DeviceRoot {
 public:
  /// KVR_DEVICE_ROOT, or where a device is described by default.
  static std::string directoryFromEnvironment();

  DeviceRoot(PropertyListFiles& lists, Log& log, const std::string& directory = directoryFromEnvironment());

  Value dictionary(std::string_view file) const;
  Value array(std::string_view file) const;
  /// As `dictionary`, but null for a file that anyone but root and the agent's own user could have written:
  /// it, the directory it stands in and the device root must belong to one of the two, and neither group nor
  /// others may write them. The modes are looked at just before the file is read; who could exchange it in
  /// between could have passed the look as well.
  Value trustedDictionary(std::string_view file) const;

  std::string pathOf(std::string_view file) const { return directory_ + "/" + std::string(file); }
  /// The stamp of a file as it is now, or nothing when it cannot be had.
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
  mutable std::map<std::string, std::string> resolved_;  ///< by path as given
  mutable std::map<std::string, std::string> distrust_;  ///< why, by the path of each file that is ignored
};

}  // namespace kvr
