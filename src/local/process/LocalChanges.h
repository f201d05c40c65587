#pragma once

#include "local/bus/LocalNotifications.h"
#include "local/device/LocalPairedDeviceRegistry.h"
#include "local/locale/LocalUserLocale.h"
#include "local/loop/FileWatch.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace kvr {

/// Posts the notifications of what is changed by editing a file: another locale in "Locale.plist", or in the
/// host's own setting where that file names none; a watch that has come to or gone from
/// "PairedDevices.plist". One for each edit, also of several that are seen at once. A file that is gone, or
/// cannot be read, may be about to be replaced: it is looked at again before that counts. Built and destroyed
/// on the loop's thread.
class LocalChanges {
 public:
  /// Where hosts keep their locale.
  static std::vector<std::string> hostLocaleFiles() { return {"/etc/locale.conf", "/etc/default/locale"}; }

  LocalChanges(EventLoop& loop, Log& log, const DeviceRoot& root, const LocalUserLocale& locale,
               const LocalPairedDeviceRegistry& pairedDevices, LocalNotifications& notifications,
               const std::vector<std::string>& hostLocale = hostLocaleFiles());

 private:
  using Clock = std::chrono::steady_clock;
  /// What the language in use depends on.
  std::string languageNow() const;
  std::set<std::string> watchesNow() const;
  /// One file of the device root, and how it is looked at.
  struct Subject {
    const char* file;
    /// Tells of so many edits, or finds nothing to tell. One that changes nothing counts only if it is
    /// certain that it was one.
    bool (LocalChanges::*tell)(std::size_t edits, bool isCertain);
    std::size_t edits = 0;          ///< not told of
    std::optional<FileStamp> seen;  ///< of the version that was looked at last
    Clock::time_point lastEdit{};
    bool isLookToCome = false;
  };
  std::optional<FileStamp> stampOf(const char* file) const;
  void handleEdit(Subject& subject, std::size_t writes, bool isWhole);
  void lookLater(Subject& subject);
  bool tellLocale(std::size_t edits, bool isCertain);
  bool tellWatches(std::size_t edits, bool isCertain);
  void post(const char* notification, std::size_t times);

  const DeviceRoot& root_;
  const LocalUserLocale& locale_;
  const LocalPairedDeviceRegistry& pairedDevices_;
  LocalNotifications& notifications_;
  const std::vector<std::string> hostLocale_;
  EventLoop& loop_;
  std::string language_;
  std::set<std::string> watches_;
  Subject localeFile_;
  Subject watchesFile_;
  std::vector<std::unique_ptr<FileWatch>> fileWatches_;
};

}  // namespace kvr
