#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace kvr {

/// An absolute URL, taken apart as far as the agent needs it.
class URL {
 public:
  /// Nothing when the text has no scheme, holds blanks or control characters, or names no host (http, https)
  /// or no absolute local path (file).
  static std::optional<URL> parse(std::string_view text);
  static URL fileURL(std::string path);

  const std::string& text() const { return text_; }
  const std::string& scheme() const { return scheme_; }  ///< lower case
  const std::string& host() const { return host_; }      ///< lower case, without brackets; empty for a file
  bool isFile() const { return scheme_ == "file"; }
  bool isWeb() const { return scheme_ == "https" || scheme_ == "http"; }
  /// Whether the host is written as "localhost", 127.x.x.x or ::1. No name is resolved.
  bool isLoopback() const;
  /// The path of a file URL, percent escapes resolved.
  const std::string& filePath() const { return filePath_; }

  std::string description() const { return text_; }

 private:
  std::string text_;
  std::string scheme_;
  std::string host_;
  std::string filePath_;
};

}  // namespace kvr
