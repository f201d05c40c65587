#pragma once

#include "ReceivedRequest.h"

#include <cstdint>
#include <mutex>
#include <optional>
#include <string>

namespace kvr::coverage_service {

/// Records requests and the answers given: one JSON document per request, NNNNNN.json, in one directory.
///
/// `{"time": seconds since 1970, "method", "version", "tls" (absent without TLS), "path", "headers":
/// [[NAME, VALUE]...], "body" (or "bodyBase64"
/// when it is not UTF-8), "status" (0 when there is to be no answer), "reason" (why it is a 400)}`.
/// Thread-safe.
class RequestRecords {
 public:
  /// Continues after the highest number in the directory. Throws when the directory cannot be created.
  explicit RequestRecords(std::string directory);

  /// The document is complete before this returns. Throws when it cannot be written.
  void add(const ReceivedRequest& request, int status, const std::optional<std::string>& reason);
  /// The number of the last document.
  std::int64_t count() const;

 private:
  const std::string directory_;
  mutable std::mutex mutex_;
  std::int64_t count_ = 0;
};

}  // namespace kvr::coverage_service
