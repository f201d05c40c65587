#include "local/device/LocalEntitlements.h"

#include <sys/stat.h>

namespace kvr {

std::optional<FileIdentity> FileIdentity::of(const std::string& path) {
  struct stat status {};
  if (path.find('\0') != std::string::npos || ::stat(path.c_str(), &status) != 0) return std::nullopt;
  return FileIdentity{status.st_dev, status.st_ino};
}

Value LocalEntitlements::valueFor(const FileIdentity& executable, std::string_view entitlement) const {
  const auto tree = root_.trustedDictionary("Entitlements.plist");
  if (!tree.isDictionary()) return {};
  for (const auto& [path, granted] : tree.dictionary()) {
    if (!path.starts_with('/') || !granted.contains(entitlement)) continue;
    if (FileIdentity::of(path) == executable) return granted[entitlement];
  }
  return {};
}

}  // namespace kvr
