#pragma once

#include "platform/log/Log.h"

#include <mutex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace kvr {

/// Keeps all lines; misused completions also count as faults. Any thread.
class SimulatedLog : public Log {
 public:
  struct Line {
    LogLevel level;
    std::string text;
  };

  explicit SimulatedLog(LogLevel least = LogLevel::Debug, bool revealPrivate = true)
      : Log(least, revealPrivate) {}

  std::vector<Line> lines() const;
  std::vector<std::string> texts() const;
  std::vector<std::string> texts(LogLevel level) const;
  /// How many lines are exactly `text`.
  std::size_t count(std::string_view text) const;
  /// Whether any line contains `part`.
  bool contains(std::string_view part) const;
  void clear();
  /// From now on keeps only the latest lines, at least `count`.
  void keepLast(std::size_t count);

  std::vector<std::string> faults() const;
  /// Returns the faults so far and clears them: for tests that provoke one.
  std::vector<std::string> takeFaults();

  void reportMisusedCompletion(std::string_view what, std::string_view name) override;

 protected:
  void write(LogLevel level, const std::string& message) override;

 private:
  mutable std::mutex mutex_;
  std::vector<Line> lines_;
  std::size_t kept_ = 0;  ///< 0: all of them
  std::vector<std::string> faults_;
};

}  // namespace kvr
