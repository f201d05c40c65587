#pragma once

#include "platform/Log.h"

#include <mutex>
#include <string>
#include <string_view>
#include <vector>

namespace kvr::testing {

/// Keeps what is logged, private values in clear.
class RecordingLog : public Log {
 public:
  RecordingLog() : Log(LogLevel::Debug, true) {}

  /// The messages at error level that hold `text`.
  std::vector<std::string> errorsWith(std::string_view text) const {
    const std::lock_guard lock(mutex_);
    std::vector<std::string> found;
    for (const std::string& message : errors_) {
      if (message.find(text) != std::string::npos) found.push_back(message);
    }
    return found;
  }

 protected:
  void write(LogLevel level, const std::string& message) override {
    if (level != LogLevel::Error) return;
    const std::lock_guard lock(mutex_);
    errors_.push_back(message);
  }

 private:
  mutable std::mutex mutex_;
  std::vector<std::string> errors_;
};

}  // namespace kvr::testing
