#pragma once

#include <string>
#include <vector>

namespace kvr {

/// Unusual serial numbers; any text is a valid one.
inline std::vector<std::string> oddSerialNumbers() {
  return {"",
          "a/../b",
          "two\r\nlines",
          "\x01\x1B[2J\x7F",
          "\"quoted\" \\",
          "Ünïcode \U0001F600",
          "…1234",
          "--all",
          "[a, b]",
          std::string("N\0UL", 4),
          std::string(100'000, 'x')};
}

}  // namespace kvr
