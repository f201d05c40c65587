#pragma once

#include <filesystem>
#include <fstream>
#include <iterator>
#include <optional>
#include <string>

namespace kvr::coverage_service {

/// The whole content of a regular file; nothing when there is none.
inline std::optional<std::string> readFile(const std::string& path) {
  std::error_code error;
  if (!std::filesystem::is_regular_file(path, error)) return std::nullopt;
  std::ifstream in(path, std::ios::binary);
  std::string content{std::istreambuf_iterator<char>(in), {}};
  if (!in.is_open() || in.bad()) return std::nullopt;
  return content;
}

}  // namespace kvr::coverage_service
