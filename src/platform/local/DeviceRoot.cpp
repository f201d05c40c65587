#include "platform/local/DeviceRoot.h"

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

/// Why something could have been written by another user, if it could. What does not exist could not.
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
  // A symbolic link is followed first, so that what is examined is what is read.
  std::error_code error;
  const auto path = std::filesystem::canonical(pathOf(file), error);
  if (error == std::errc::no_such_file_or_directory) return {};
  if (error) return dictionary(file);  // which cannot be read either, and says why
  if (!isTrusted(path.string())) return {};
  auto tree = lists_.read(path.string(), PropertyListFiles::Expected::Dictionary, kLeave);
  return tree ? *std::move(tree) : Value();
}

bool DeviceRoot::isTrusted(const std::string& path) const {
  auto reason = distrustOf(directory_);
  if (!reason) reason = distrustOf(std::filesystem::path(path).parent_path().string());
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
