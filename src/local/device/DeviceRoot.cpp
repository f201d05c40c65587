#include "local/device/DeviceRoot.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <optional>
#include <system_error>
#include <utility>

namespace kvr {
namespace {

constexpr auto kLeave = PropertyListFiles::WhenDamaged::Leave;

std::string absolute(const std::string& directory) {
  std::error_code error;
  auto path = std::filesystem::absolute(directory, error).lexically_normal().string();
  while (path.ends_with('/')) path.pop_back();
  return path;
}

/// Why another user could have written a file or directory, if one could; nothing if it does not exist.
std::optional<std::string> distrustOf(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) {
    if (errno == ENOENT) return std::nullopt;
    return path + " cannot be examined: " + std::generic_category().message(errno);
  }
  if (status.st_uid != 0 && status.st_uid != ::geteuid()) {
    return path + " belongs to user " + std::to_string(status.st_uid);
  }
  if ((status.st_mode & S_IWOTH) != 0) return path + " can be written by everyone";
  if ((status.st_mode & S_IWGRP) != 0)
    return path + " can be written by group " + std::to_string(status.st_gid);
  return std::nullopt;
}

/// Whether `resolved` is the file that `given` leads to, and not a link.
bool isSameFile(const std::string& given, const std::string& resolved) {
  struct stat one {};
  struct stat other {};
  if (::lstat(resolved.c_str(), &other) != 0 || S_ISLNK(other.st_mode)) return false;
  if (given == resolved) return true;
  return ::stat(given.c_str(), &one) == 0 && one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

}  // namespace

std::string DeviceRoot::directoryFromEnvironment() {
  const char* directory = std::getenv("KVR_DEVICE_ROOT");
  return directory != nullptr && directory[0] != '\0' ? directory : "/var/lib/kvragent/device";
}

DeviceRoot::DeviceRoot(PropertyListFiles& lists, Log& log, const std::string& directory)
    : lists_(lists), log_(log), directory_(absolute(directory)) {}

Value DeviceRoot::dictionary(std::string_view file) const {
  auto tree = lists_.read(pathOf(file), PropertyListFiles::Expected::Dictionary, kLeave);
  return tree ? *std::move(tree) : Value();
}

Value DeviceRoot::array(std::string_view file) const {
  auto tree = lists_.read(pathOf(file), PropertyListFiles::Expected::Array, kLeave);
  return tree ? *std::move(tree) : Value();
}

Value DeviceRoot::trustedDictionary(std::string_view file) const {
  // Follow symbolic links first, so that the file that is checked is the one that is read.
  std::error_code error;
  const auto path = resolved(file, error);
  if (error == std::errc::no_such_file_or_directory) return {};
  if (error) return dictionary(file);  // it cannot be read either, and the error is logged there
  if (!isTrusted(path)) return {};
  auto tree = lists_.read(path, PropertyListFiles::Expected::Dictionary, kLeave);
  return tree ? *std::move(tree) : Value();
}

/// The file's path without symbolic links. An earlier result stays valid while it is not a link itself and
/// leads to the same file.
std::string DeviceRoot::resolved(std::string_view file, std::error_code& error) const {
  const auto given = pathOf(file);
  const std::lock_guard lock(mutex_);
  auto& found = resolved_[given];
  if (!found.empty() && isSameFile(given, found)) return found;
  found = std::filesystem::canonical(given, error).string();
  return found;
}

bool DeviceRoot::isTrusted(const std::string& path) const {
  auto reason = distrustOf(directory_);
  const auto parent = path.substr(0, path.rfind('/'));
  if (!reason && parent != directory_) reason = distrustOf(parent.empty() ? "/" : parent);
  if (!reason) reason = distrustOf(path);
  const std::lock_guard lock(mutex_);
  if (!reason) {
    distrust_.erase(path);
    return true;
  }
  auto& reported = distrust_[path];
  if (reported != *reason) log_.error("%s is ignored: %s", path, *reason);
  reported = *std::move(reason);
  return false;
}

}  // namespace kvr
