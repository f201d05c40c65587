#pragma once

#include "local/device/DeviceRoot.h"
#include "platform/services/StringTables.h"
#include "platform/services/UserLocale.h"

#include <string>

namespace kvr {

/// Tables below "Resources" of the device root, BUNDLE/LANGUAGE/TABLE.plist. Tables missing there are taken
/// from those installed with the agent.
class LocalStringTables : public StringTables {
 public:
  LocalStringTables(const DeviceRoot& root, const UserLocale& locale,
                    std::string installed = directoryOfThisProgram());

  std::string localizedString(const std::string& bundle, const std::string& table, const std::string& key,
                              const std::string& defaultValue) const override;

  /// Where this program's resources are, relative to the program itself: share/kvragent/Resources of the
  /// installation or of the build.
  static std::string directoryOfThisProgram();

 private:
  const DeviceRoot& root_;
  const UserLocale& locale_;
  const std::string installed_;
};

}  // namespace kvr
