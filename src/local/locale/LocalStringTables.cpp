#include "local/locale/LocalStringTables.h"

#include <array>
#include <filesystem>
#include <utility>

namespace kvr {

LocalStringTables::LocalStringTables(const DeviceRoot& root, const UserLocale& locale, std::string installed)
    : root_(root), locale_(locale), installed_(std::move(installed)) {}

std::string LocalStringTables::directoryOfThisProgram() {
  std::error_code unknown;
  const auto program = std::filesystem::read_symlink("/proc/self/exe", unknown).parent_path();
  for (const auto* prefix : {"..", "../.."}) {
    auto directory = (program / prefix / "share/kvragent/Resources").lexically_normal();
    if (std::filesystem::is_directory(directory, unknown)) return directory.string();
  }
  return {};
}

std::string LocalStringTables::localizedString(const std::string& bundle, const std::string& table,
                                               const std::string& key,
                                               const std::string& defaultValue) const {
  // Only letters, digits and a few marks, because the identifier becomes a directory name and must not lead
  // elsewhere.
  const auto identifier = locale_.preferredIdentifier();
  const std::array<std::string, 3> languages{identifier,
                                             identifier.substr(0, identifier.find_first_of("_-@;=")), "en"};
  for (const auto& language : languages) {
    const auto file = std::filesystem::path(bundle) / language / (table + ".plist");
    for (const auto& path : {std::filesystem::path(root_.pathOf("Resources")) / file,
                             std::filesystem::path(installed_) / file}) {
      const auto texts = root_.lists().read(path.string(), PropertyListFiles::Expected::Dictionary,
                                            PropertyListFiles::WhenDamaged::Leave);
      if (!texts) continue;
      if (const auto text = (*texts)[key].stringIfAny()) return *text;
    }
  }
  return defaultValue;
}

}  // namespace kvr
