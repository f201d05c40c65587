#pragma once

#include <string_view>

namespace kvr {

/// Whether a text from outside can be the name of a file in a directory of ours: it leads to no other
/// directory, is not hidden, and is the whole name for the system too.
constexpr bool canNameFile(std::string_view text) {
  return !text.empty() && text.front() != '.' && text.find('/') == std::string_view::npos &&
         text.find('\0') == std::string_view::npos;
}

}  // namespace kvr
