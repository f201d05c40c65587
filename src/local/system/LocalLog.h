#pragma once

#include "platform/log/Log.h"

#include <chrono>
#include <memory>
#include <mutex>

namespace kvr {

/// The log of this machine: the journal, or lines on a file descriptor.
///
/// A line is `TIMESTAMP LEVEL com.tarsil.Kavrel:core MESSAGE` and is written by one call. Whatever in a
/// message could be taken for the end of a line, or for a command to a terminal, is written as an escape.
class LocalLog : public Log {
 public:
  enum class Sink { Journal, Lines };

  /// As the environment has it: the journal if standard error leads there (JOURNAL_STREAM), else lines on
  /// standard error; KVR_LOG_LEVEL names the least level written, KVR_LOG_PRIVATE=1 reveals private values.
  static std::unique_ptr<LocalLog> fromEnvironment();

  /// `descriptor` takes lines, and also those that the journal does not take. It stays the caller's.
  LocalLog(LogLevel least, bool revealPrivate, Sink sink, int descriptor);

 protected:
  void write(LogLevel level, const std::string& message) override;

 private:
  void writeLine(LogLevel level, const std::string& message);
  bool isReady(std::chrono::steady_clock::time_point deadline);

  const Sink sink_;
  const int descriptor_;
  const bool mayBlock_;
  std::mutex mutex_;    ///< guards what follows, and the order of lines whose writing may block
  bool stuck_ = false;  ///< nobody took the last line, or all of it
  bool torn_ = false;   ///< it has been begun
};

}  // namespace kvr
