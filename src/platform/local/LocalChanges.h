#pragma once

#include "platform/local/FileWatch.h"
#include "platform/local/LocalNotifications.h"
#include "platform/local/LocalPairedDeviceRegistry.h"
#include "platform/local/LocalUserLocale.h"

#include <array>
#include <memory>
#include <set>
#include <string>
#include <vector>

namespace kvr {

/// Posts the notifications of what is changed by editing a file: another locale in "Locale.plist", or in the
/// host's own setting where that file names none; a watch that has come to or gone from
/// "PairedDevices.plist". Built and destroyed on the loop's thread.
class LocalChanges {
 public:
  /// Where hosts keep their locale.
  static std::vector<std::string> hostLocaleFiles() { return {"/etc/locale.conf", "/etc/default/locale"}; }

  LocalChanges(EventLoop& loop, Log& log, const DeviceRoot& root, const LocalUserLocale& locale,
               const LocalPairedDeviceRegistry& pairedDevices, LocalNotifications& notifications,
               const std::vector<std::string>& hostLocale = hostLocaleFiles());

 private:
  /// What the language in use depends on.
  std::string languageNow() const;
  std::set<std::string> watchesNow() const;
  void noticeSoon();
  void notice();

  const LocalUserLocale& locale_;
  const LocalPairedDeviceRegistry& pairedDevices_;
  LocalNotifications& notifications_;
  const std::vector<std::string> hostLocale_;
  EventLoop& loop_;
  bool isNoticing_ = false;  ///< soon
  std::string language_;
  std::set<std::string> watches_;
  std::vector<std::unique_ptr<FileWatch>> fileWatches_;
};

}  // namespace kvr
