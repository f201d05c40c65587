#pragma once

#include <string_view>

namespace kvr {

/// Whether untrusted text can be used as a file name in one of our directories: it cannot lead to another
/// directory, is not a hidden name, and contains no NUL that would cut it short.
constexpr bool canNameFile(std::string_view text) {
  return !text.empty() && text.front() != '.' && text.find('/') == std::string_view::npos &&
         text.find('\0') == std::string_view::npos;
}

}  // namespace kvr
