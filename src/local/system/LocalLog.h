#pragma once

#include "local/system/JournalSocket.h"
#include "platform/log/Log.h"

#include <chrono>
#include <memory>
#include <mutex>

namespace kvr {

/// The log of this machine: the journal, or lines on a file descriptor. A reader that has stopped reading
/// delays the agent by a second, once; what it does not take is lost.
///
/// A line is `TIMESTAMP LEVEL com.tarsil.Kavrel:core MESSAGE`, written with one call. Characters of a message
/// that could end the line, or control a terminal, are escaped.
class LocalLog : public Log {
 public:
  enum class Sink { Journal, Lines };

  /// Configured by the environment: the journal if standard error leads there (JOURNAL_STREAM), else lines on
  /// standard error. KVR_LOG_LEVEL is the lowest level written; KVR_LOG_PRIVATE=1 reveals private values.
  static std::unique_ptr<LocalLog> fromEnvironment();

  /// `descriptor` receives the lines, and those that the journal does not accept. The caller keeps ownership.
  LocalLog(LogLevel least, bool revealPrivate, Sink sink, int descriptor);

 protected:
  void write(LogLevel level, const std::string& message) override;

 private:
  bool writeEntry(LogLevel level, const std::string& message);
  void writeLine(LogLevel level, const std::string& message);
  bool isReady(std::chrono::steady_clock::time_point deadline);

  const Sink sink_;
  const int descriptor_;
  const bool mayBlock_;
  std::mutex mutex_;  ///< guards what follows, and the order of what may block
  JournalSocket journal_;
  bool stuck_ = false;  ///< the last line or entry was not accepted, or not all of it
  bool torn_ = false;   ///< a part of it was written
};

}  // namespace kvr
