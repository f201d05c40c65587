#pragma once

#include "local/system/Descriptor.h"

#include <chrono>
#include <string>
#include <string_view>

namespace kvr {

/// Sends entries to the journal in its native format. Unlike the C library of the journal, it does not wait
/// for ever when the journal has stopped reading. Not thread-safe.
class JournalSocket {
 public:
  enum class Outcome {
    Sent,
    Full,    ///< the journal accepted nothing until the deadline
    Failed,  ///< there is no journal
  };

  /// Appends one field to an entry. `value` may have any bytes.
  static void appendField(std::string& entry, std::string_view name, std::string_view value);
  /// Connects if necessary, and waits at most until `deadline`.
  Outcome send(const std::string& entry, std::chrono::steady_clock::time_point deadline);

 private:
  bool connect();
  /// Returns 0 or the error.
  int trySending(const std::string& entry) const;

  Descriptor socket_;
};

}  // namespace kvr
