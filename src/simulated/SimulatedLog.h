#pragma once

#include "platform/log/Log.h"

#include <mutex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace kvr {

/// Keeps every line; misused completions are faults besides. Any thread.
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
  /// How many lines read exactly `text`.
  std::size_t count(std::string_view text) const;
  /// Whether a line holds `part`.
  bool contains(std::string_view part) const;
  void clear();
  /// From here on only the last lines are kept, so many at least.
  void keepLast(std::size_t count);

  std::vector<std::string> faults() const;
  /// The faults so far, which are then no faults any more: for tests that provoke one.
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
