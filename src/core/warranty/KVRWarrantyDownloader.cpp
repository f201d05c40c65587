#include "core/warranty/KVRWarrantyDownloader.h"

#include "core/signing/AccountHeaders.h"
#include "core/signing/KestHeaders.h"
#include "core/warranty/CacheMetadata.h"
#include "core/warranty/KVRServerVersionUtilities.h"
#include "core/warranty/WarrantyKeys.h"
#include "platform/codec/JSON.h"
#include "platform/codec/PropertyList.h"

#include <cerrno>

namespace kvr {
namespace {

constexpr std::int32_t kRetries = 2;
constexpr double kAttemptTimeout = 30;  // seconds
constexpr std::size_t kLargestFile = std::size_t{64} << 20U;
constexpr std::size_t kLongestFileName = 255;

/// The path of a file's variant for a serial number. For ABC, "w.plist" becomes "w.ABC.plist", and "w", whose
/// extension is empty, becomes "w.ABC.". Nothing if the serial number cannot be part of a file name.
std::optional<std::string> variantPath(const std::string& path, const std::string& serialNumber) {
  const auto nameStart = path.rfind('/') + 1;
  const auto dot = path.rfind('.');
  const bool hasExtension = dot != std::string::npos && dot > nameStart && dot + 1 < path.size();
  const auto stem = path.substr(0, hasExtension ? dot : path.size());
  const auto name = stem.substr(nameStart) + "." + serialNumber + (hasExtension ? path.substr(dot) : ".");
  if (name.size() > kLongestFileName || name.find_first_of(std::string_view("/\0", 2)) != std::string::npos) {
    return std::nullopt;
  }
  return path.substr(0, nameStart) + name;
}

/// A file's content; nothing if the file is missing or, with an error in the log, cannot be read. A file that
/// is too large is an error instead, so that no other file is used in its place.
Result<std::optional<std::string>> contentOf(Platform& platform, const std::string& path) {
  auto contents = platform.files.read(path, kLargestFile);
  if (!contents) {
    platform.log.error("URL '%@' cannot be read: %@", URL::fileURL(path), contents.error());
    if (contents.error().code == EFBIG) return contents.error();
    return std::optional<std::string>();
  }
  auto file = *std::move(contents);
  if (!file || file->bytes.empty()) return std::optional<std::string>();
  return std::optional(std::move(file->bytes));
}

}  // namespace

KVRWarrantyDownloader::KVRWarrantyDownloader(Platform& platform, DownloadCaller caller)
    : platform_(platform), caller_(std::move(caller)) {
  platform_.log.debug("%s: callingProcess=%@", "-[KVRWarrantyDownloader initWithCallingProcessBundleID:]",
                      caller_.bundleID);
}

void KVRWarrantyDownloader::downloadWarrantyForSerialNumber(const std::optional<std::string>& serialNumber,
                                                            const DownloadCompletion& completionHandler) {
  platform_.log.standard("%s: %{private}@",
                         "-[KVRWarrantyDownloader downloadWarrantyForSerialNumber:completionHandler:]",
                         serialNumber);
  // This makes the version check below fetch the asset again.
  platform_.preferences.removeObject(preference::kServerVersionCache);
  KVRServerVersionUtilities::serverVersionSupported(
      platform_, KVRServerVersionUtilities::BoolCompletion(
                     platform_.log, "downloadWarrantyForSerialNumber",
                     [self = shared_from_this(), serialNumber, completionHandler](bool supported) {
                       if (supported) {
                         self->_downloadWarrantyForSerialNumber(serialNumber, completionHandler);
                         return;
                       }
                       self->platform_.log.standard("Warranty download skipped server due to server version");
                       completionHandler(false, nullptr);
                     }));
}

bool KVRWarrantyDownloader::isLocalDevice(const std::optional<std::string>& serialNumber) const {
  const auto local = caller_.localSerialNumber();
  return serialNumber && local && *serialNumber == *local;
}

void KVRWarrantyDownloader::_downloadWarrantyForSerialNumber(const std::optional<std::string>& serialNumber,
                                                             const DownloadCompletion& withCompletion) {
  const auto* key =
      isLocalDevice(serialNumber) ? preference::kWarrantyURL : preference::kWearablesWarrantyURL;
  const Value endpoint = platform_.preferences.objectForKey(key);
  const auto url = endpoint.isString() ? URL::parse(endpoint.string()) : std::nullopt;
  const auto background = platform_.queues.concurrentQueue(Priority::Default);
  const auto finishLater = [self = shared_from_this(), background, serialNumber,
                            withCompletion](const Value& answer) {
    background->async(
        [self, answer, serialNumber, withCompletion] { self->finish(answer, serialNumber, withCompletion); });
  };
  if (!url || (!url->isFile() && !url->isWeb())) {
    platform_.log.error("URL '%@' is neither a web address nor a file", endpoint);
    finishLater({});
  } else if (url->isFile()) {
    finishLater(dictionaryFromURL(*url, serialNumber));
  } else {
    // Signing may wait for a renewal, and with a version override this is still the caller's thread.
    background->async(
        [self = shared_from_this(), url = *url, serialNumber,
         completion = AttemptCompletion(platform_.log, "_downloadWarrantyForSerialNumber", finishLater)] {
          self->_downloadWarrantyFromServerURL(url, serialNumber, kRetries, completion);
        });
  }
}

void KVRWarrantyDownloader::_downloadWarrantyFromServerURL(const URL& url,
                                                           const std::optional<std::string>& serialNumber,
                                                           std::int32_t withRetries,
                                                           const AttemptCompletion& completionBlock) {
  auto& log = platform_.log;
  log.standard("%{private}@ : warranty download attempt (%d/%d)", serialNumber, kRetries - withRetries,
               kRetries);
  HTTPRequest request;
  request.url = url.text();
  request.timeout = kAttemptTimeout;
  request.followsRedirects = false;
  const bool isRetry = withRetries < kRetries;
  if (!kvr_signWithAccountHeaders(platform_, request, isRetry, true)) {
    log.standard("Unable to load sign request, failing warranty download");
    completionBlock({});
    return;
  }
  log.standard("Retrying request:");
  auto& session = platform_.http.sharedSession();
  request.sourceApplicationBundleID = caller_.bundleID;
  kvr_setCoverageRequestBodyWithSerialNumber(platform_, request, serialNumber);
  if (isLocalDevice(serialNumber)) addKestAuthenticationHeadersWithBody(platform_, request, request.body);
  log.standard("Headers: %@", headerDescription(request));
  log.standard("Body: %@", bodyDescription(request));
  session.send(std::move(request), [self = shared_from_this(), url, serialNumber, withRetries,
                                    completionBlock](const HTTPResponse& response) {
    self->handleResponse(response, url, serialNumber, withRetries, completionBlock);
  });
}

void KVRWarrantyDownloader::handleResponse(const HTTPResponse& response, const URL& url,
                                           const std::optional<std::string>& serialNumber,
                                           std::int32_t retries, const AttemptCompletion& completion) {
  const auto parsed = response.body ? readJSON(*response.body) : Result<Value>(Value());
  const bool isParsed = response.body && parsed;
  platform_.log.standard("load warranty status: %ld : %@", response.status,
                         isParsed ? describe(*parsed) : describe(response.error));
  if (response.status == 200 && response.body && !parsed) {
    platform_.log.error("The coverage service's answer is no JSON: %@", parsed.error());
  }
  if (response.status == 401 && retries >= 1) {
    _downloadWarrantyFromServerURL(url, serialNumber, retries - 1, completion);
  } else if (response.status == 200 && isParsed) {
    completion(*parsed);
  } else {
    completion({});
  }
}

void KVRWarrantyDownloader::finish(const Value& answer, const std::optional<std::string>& serialNumber,
                                   const DownloadCompletion& completion) {
  if (!answer.isDictionary()) {
    platform_.log.error("kvragent failed to load warranty");
    completion(false, nullptr);
    return;
  }
  platform_.log.standard("downloaded warranty: %@", answer);
  const KVRWarrantyRef warranty = KVRWarranty::warrantyWithDictionary(platform_, answer);
  const KVRWarrantyRef cached = KVRWarranty::cachedWarrantyForSerialNumber(platform_, serialNumber);
  if (caller_.warrantyDownloaded(warranty, cached)) {
    store(*warranty, cached, serialNumber);
  } else {
    platform_.log.error("the warranty is not cached, its conversion date cannot be stored");
  }
  completion(true, warranty);
}

void KVRWarrantyDownloader::store(const KVRWarranty& warranty, const KVRWarrantyRef& cached,
                                  const std::optional<std::string>& serialNumber) {
  const auto locale = platform_.locale.preferredIdentifier();
  platform_.log.standard("caching warranty for locale: '%@', version: %@", locale, kCacheFormatVersion);
  warranty.cacheWarranty(serialNumber);
  if (!serialNumber) return;  // without one there is no hash to keep the metadata under
  const CacheMetadata metadata(*serialNumber);
  // The same answer is news where the cached one did not count any more.
  const auto wasStored = [this](const std::string& key, const Value& value) {
    return platform_.preferences.objectForKey(key) == value;
  };
  const bool isNews =
      platform_.observers.areThere() &&
      !(cached && cached->dictionaryRepresentation() == warranty.dictionaryRepresentation() &&
        wasStored(metadata.localeKey, locale) && wasStored(metadata.versionKey, kCacheFormatVersion));
  platform_.preferences.setObjects({{metadata.lastUpdatedDateKey, platform_.clock.now()},
                                    {metadata.localeKey, locale},
                                    {metadata.versionKey, kCacheFormatVersion}});
  if (isNews) platform_.observers.tell({{*serialNumber}, {}, false});
}

Value KVRWarrantyDownloader::dictionaryFromURL(const URL& url,
                                               const std::optional<std::string>& forSerialNumber) const {
  std::optional<std::string> content;
  const auto variant = forSerialNumber ? variantPath(url.filePath(), *forSerialNumber) : std::nullopt;
  if (variant) {
    auto own = contentOf(platform_, *variant);
    if (!own) return {};
    content = *std::move(own);
    if (content) platform_.log.standard("loading warranty from: %@", URL::fileURL(*variant));
  } else if (forSerialNumber) {
    platform_.log.standard("the serial number cannot be a part of a file name: URL '%@' has no variant", url);
  }
  if (!content) {
    platform_.log.standard("loading warranty from: %@", url);
    if (auto common = contentOf(platform_, url.filePath())) content = *std::move(common);
  }
  if (!content) {
    platform_.log.error("URL '%@' contains no plist data", url);
    return {};
  }
  const auto parsed = readPropertyList(*content);
  if (parsed) return *parsed;
  platform_.log.error("Error serializing plist file from URL '%@': %@", url, parsed.error());
  return {};
}

}  // namespace kvr
