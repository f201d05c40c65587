#pragma once

#include "core/warranty/DownloadCompletion.h"
#include "platform/Platform.h"
#include "platform/log/Completion.h"
#include "platform/text/URL.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

namespace kvr {

/// The client that a downloader works for, and its connections to the rest of the agent. Any thread.
struct DownloadCaller {
  /// The client for which requests are made.
  std::string bundleID;
  /// The serial number of the device that the agent runs on; nothing when it has none.
  std::function<std::optional<std::string>()> localSerialNumber;
  /// Called with each downloaded warranty before it is cached, and with the one cached so far, or null. False
  /// when the warranty must not be cached, because what is new in it could not be stored.
  std::function<bool(const KVRWarrantyRef& warranty, const KVRWarrantyRef& cachedWarranty)>
      warrantyDownloaded;
};

/// Downloads one device's warranty from the coverage service and caches it.
///
/// A download goes through these steps: the version gate (does the service still speak a version that the
/// agent speaks), up to three signed attempts (only status 401 is tried again, with the account token
/// renewed) or reading a local file, and then caching with metadata. A failure leaves the cache and its
/// metadata as they were. Make one for each download; the download keeps it alive. Any thread.
class KVRWarrantyDownloader : public std::enable_shared_from_this<KVRWarrantyDownloader> {
 public:
  /// The dictionary that an attempt returned; a value of any other kind is a failure.
  using AttemptCompletion = Completion<Value>;

  KVRWarrantyDownloader(Platform& platform, DownloadCaller caller);

  /// Answers once: later, on a background queue, or before it returns when a version override rejects the
  /// service. Never blocks the caller on the network or on a renewal.
  void downloadWarrantyForSerialNumber(const std::optional<std::string>& serialNumber,
                                       const DownloadCompletion& completionHandler);

  /// The download without the version gate.
  void _downloadWarrantyForSerialNumber(const std::optional<std::string>& serialNumber,
                                        const DownloadCompletion& withCompletion);
  /// One attempt, with `withRetries` more left. Blocks while the request is signed.
  void _downloadWarrantyFromServerURL(const URL& url, const std::optional<std::string>& serialNumber,
                                      std::int32_t withRetries, const AttemptCompletion& completionBlock);
  /// The property list in the file's variant for this serial number, or if there is none, in the file itself;
  /// null if it is missing or cannot be read.
  Value dictionaryFromURL(const URL& url, const std::optional<std::string>& forSerialNumber) const;

 private:
  bool isLocalDevice(const std::optional<std::string>& serialNumber) const;
  void handleResponse(const HTTPResponse& response, const URL& url,
                      const std::optional<std::string>& serialNumber, std::int32_t retries,
                      const AttemptCompletion& completion);
  void finish(const Value& answer, const std::optional<std::string>& serialNumber,
              const DownloadCompletion& completion);
  void store(const KVRWarranty& warranty, const KVRWarrantyRef& cached,
             const std::optional<std::string>& serialNumber);

  Platform& platform_;
  const DownloadCaller caller_;
};

}  // namespace kvr
