#pragma once

#include "local/bus/LocalNotifications.h"
#include "local/device/LocalPairedDeviceRegistry.h"
#include "local/locale/LocalUserLocale.h"
#include "local/loop/FileWatch.h"
#include "platform/services/Observers.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace kvr {

/// Posts notifications for changes made by editing files: another locale in "Locale.plist", or in the host's
/// own setting if that file names none; a watch added to or removed from "PairedDevices.plist".
///
/// Posts one notification for each edit, even if several edits are noticed at once. A file that is missing or
/// unreadable may be about to be replaced, so it is checked again a moment later. Built and destroyed on the
/// loop's thread.
///
/// Observers, if given, are told when what the two files about devices say of them is another.
class LocalChanges {
 public:
  /// Where hosts keep their locale.
  static std::vector<std::string> hostLocaleFiles() { return {"/etc/locale.conf", "/etc/default/locale"}; }

  LocalChanges(EventLoop& loop, Log& log, const DeviceRoot& root, const LocalUserLocale& locale,
               const LocalPairedDeviceRegistry& pairedDevices, LocalNotifications& notifications,
               Observers* observers = nullptr,
               const std::vector<std::string>& hostLocale = hostLocaleFiles());

 private:
  using Clock = std::chrono::steady_clock;
  /// Everything that the language in use depends on.
  std::string languageNow() const;
  std::set<std::string> watchesNow() const;
  /// One file of the device root and the state of watching it.
  struct Subject {
    const char* file;
    /// Posts for `edits` edits; false if there was nothing to post. A single edit without a visible change
    /// counts only when `isCertain`.
    bool (LocalChanges::*tell)(std::size_t edits, bool isCertain);
    std::size_t edits = 0;          ///< not posted yet
    std::optional<FileStamp> seen;  ///< of the version checked last
    Clock::time_point lastEdit{};
    bool isLookToCome = false;  ///< a check is scheduled
  };
  std::optional<FileStamp> stampOf(const char* file) const;
  /// What clients are told of devices: this one and its watches.
  Value devicesNow() const;
  void tellDevices();
  void handleEdit(Subject& subject, std::size_t writes, bool isWhole);
  void lookLater(Subject& subject);
  bool tellLocale(std::size_t edits, bool isCertain);
  bool tellWatches(std::size_t edits, bool isCertain);
  void post(const char* notification, std::size_t times);

  const DeviceRoot& root_;
  const LocalUserLocale& locale_;
  const LocalPairedDeviceRegistry& pairedDevices_;
  LocalNotifications& notifications_;
  Observers* const observers_;
  const std::vector<std::string> hostLocale_;
  EventLoop& loop_;
  std::string language_;
  std::set<std::string> watches_;
  Value devices_;
  Subject localeFile_;
  Subject watchesFile_;
  std::vector<std::unique_ptr<FileWatch>> fileWatches_;
};

}  // namespace kvr
