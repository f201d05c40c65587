#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

namespace kvr::testing {

/// A fresh directory that is removed with everything in it at the end.
class TemporaryDirectory {
 public:
  TemporaryDirectory();
  ~TemporaryDirectory();
  TemporaryDirectory(const TemporaryDirectory&) = delete;
  TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;

  const std::filesystem::path& path() const { return path_; }
  std::filesystem::path operator/(std::string_view name) const { return path_ / name; }
  /// Writes a file below the directory, with its missing parents, and returns its path.
  std::filesystem::path write(std::string_view name, std::string_view content) const;

 private:
  std::filesystem::path path_;
};

/// Nothing for a file that cannot be opened.
std::optional<std::string> contentOfFile(const std::filesystem::path& path);

}  // namespace kvr::testing
