#pragma once

#include <string>

namespace kvr {

class Random {
 public:
  virtual ~Random() = default;
  /// A new random UUID: 36 characters, 8-4-4-4-12 upper-case hexadecimal digits. Any thread.
  virtual std::string uuid() = 0;
};

}  // namespace kvr
