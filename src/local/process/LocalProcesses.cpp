#include "local/process/LocalProcesses.h"

#include "local/device/LocalEntitlements.h"

#include <unistd.h>

namespace kvr {

std::int64_t LocalProcesses::executablePath(std::int32_t process, std::span<char> buffer) const {
  const std::string link = "/proc/" + std::to_string(process) + "/exe";
  const auto length = ::readlink(link.c_str(), buffer.data(), buffer.size());
  // A path that fills the whole buffer may have been truncated.
  if (length <= 0 || static_cast<std::size_t>(length) >= buffer.size()) return -1;
  const std::string path(buffer.data(), static_cast<std::size_t>(length));
  const auto runs = FileIdentity::of(link);
  return runs && path.starts_with('/') && FileIdentity::of(path) == runs ? length : -1;
}

std::optional<std::string> LocalProcesses::bundleLocationForExecutable(const std::string& path) const {
  if (!path.starts_with('/')) return std::nullopt;
  for (auto slash = path.rfind('/'); true; slash = path.rfind('/', slash - 1)) {
    const std::string directory = slash == 0 ? "/" : path.substr(0, slash);
    const auto bundle = bundleAt(directory);
    if (bundle && bundle->identifier) return directory;
    if (slash == 0) return std::nullopt;
  }
}

std::optional<Bundle> LocalProcesses::bundleAt(const std::string& location) const {
  const std::string path = location.ends_with('/') ? location + "Info.plist" : location + "/Info.plist";
  const auto tree =
      lists_.read(path, PropertyListFiles::Expected::Dictionary, PropertyListFiles::WhenDamaged::Leave);
  if (!tree || tree->isNull()) return std::nullopt;
  return Bundle{location, (*tree)["BundleIdentifier"].stringIfAny()};
}

}  // namespace kvr
