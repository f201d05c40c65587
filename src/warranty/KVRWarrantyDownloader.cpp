#include "warranty/KVRWarrantyDownloader.h"

#include "devices/KVRDevicesManager.h"
#include "platform/JSON.h"
#include "platform/PropertyList.h"
#include "scheduling/KVRConversionOutreachActivity.h"
#include "scheduling/KVRScheduler.h"
#include "scheduling/SchedulingKeys.h"
#include "signing/AccountHeaders.h"
#include "signing/KestHeaders.h"
#include "warranty/CacheMetadata.h"
#include "warranty/KVRServerVersionUtilities.h"
#include "warranty/WarrantyKeys.h"

namespace kvr {
namespace {

constexpr std::int32_t kRetries = 2;
constexpr double kAttemptTimeout = 30;  // seconds
constexpr std::size_t kLargestFile = 1U << 20U;

/// The conversion date that was scheduled and could not be stored, if the last one could not: the downloads
/// of its own outreach would schedule it again, back to back for as long as the disk is full. Guarded by the
/// turn.
struct UnstoredDate {
  std::optional<Date> date;
};

/// "w.plist" for serial number ABC is "w.ABC.plist"; nothing for a serial number that is no file name.
std::optional<std::string> variantPath(const std::string& path,
                                       const std::optional<std::string>& serialNumber) {
  if (!serialNumber || serialNumber->find('/') != std::string::npos ||
      serialNumber->find('\0') != std::string::npos) {
    return std::nullopt;
  }
  const auto nameStart = path.rfind('/') + 1;
  const auto dot = path.rfind('.');
  const bool hasExtension = dot != std::string::npos && dot > nameStart && dot + 1 < path.size();
  if (!hasExtension) return path + "." + *serialNumber;
  return path.substr(0, dot) + "." + *serialNumber + path.substr(dot);
}

std::optional<std::string> contentOf(Platform& platform, const std::string& path) {
  auto contents = platform.files.read(path, kLargestFile);
  if (!contents || !*contents || (*contents)->bytes.empty()) return std::nullopt;
  return (*contents)->bytes;
}

}  // namespace

KVRWarrantyDownloader::KVRWarrantyDownloader(Platform& platform, std::string callingProcessBundleID)
    : platform_(platform), callingProcessBundleID_(std::move(callingProcessBundleID)) {
  platform_.log.debug("%s: callingProcess=%@", "-[KVRWarrantyDownloader initWithCallingProcessBundleID:]",
                      callingProcessBundleID_);
}

void KVRWarrantyDownloader::downloadWarrantyForSerialNumber(const std::optional<std::string>& serialNumber,
                                                            const DownloadCompletion& completionHandler) {
  platform_.log.standard("%s: %{private}@",
                         "-[KVRWarrantyDownloader downloadWarrantyForSerialNumber:completionHandler:]",
                         serialNumber);
  // So that the version check below always fetches the asset afresh.
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
  const auto local = KVRDevicesManager::sharedManager(platform_)->defaultDevice()->serialNumber();
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
  request.sourceApplicationBundleID = callingProcessBundleID_;
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
  if (response.body && !parsed) {
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
  _scheduleConversionOutreachIfRequiredForWarranty(warranty, cached);
  store(*warranty, serialNumber);
  completion(true, warranty);
}

void KVRWarrantyDownloader::store(const KVRWarranty& warranty,
                                  const std::optional<std::string>& serialNumber) {
  const auto locale = platform_.locale.preferredIdentifier();
  platform_.log.standard("caching warranty for locale: '%@', version: %@", locale, kCacheFormatVersion);
  warranty.cacheWarranty(serialNumber);
  if (!serialNumber) return;  // without one there is no hash to keep the metadata under
  const CacheMetadata metadata(*serialNumber);
  platform_.preferences.setObjects({{metadata.lastUpdatedDateKey, platform_.clock.now()},
                                    {metadata.localeKey, locale},
                                    {metadata.versionKey, kCacheFormatVersion}});
}

Value KVRWarrantyDownloader::dictionaryFromURL(const URL& url,
                                               const std::optional<std::string>& forSerialNumber) const {
  std::optional<std::string> content;
  if (const auto variant = variantPath(url.filePath(), forSerialNumber)) {
    content = contentOf(platform_, *variant);
    if (content) platform_.log.standard("loading warranty from: %@", URL::fileURL(*variant));
  }
  if (!content) {
    platform_.log.standard("loading warranty from: %@", url);
    content = contentOf(platform_, url.filePath());
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

void KVRWarrantyDownloader::_scheduleConversionOutreachIfRequiredForWarranty(
    const KVRWarrantyRef& warranty, const KVRWarrantyRef& andCachedWarranty) {
  if (!warranty) return;
  const auto date = warranty->zubOfferConversionDate();
  if (andCachedWarranty) {
    const auto cachedDate = andCachedWarranty->zubOfferConversionDate();
    if (!cachedDate || !date || *cachedDate == *date) return;
  }
  if (!date) return;
  // Downloads of several devices come here at once; of two dates, the earlier one has to stay.
  const auto turn = KVRScheduler::takeTurn(platform_);
  const auto unstored = platform_.sharedObjects.get<UnstoredDate>([] { return new UnstoredDate; });
  auto scheduled = platform_.preferences.dateForKey(preference::kConversionOutreachScheduledDate);
  if (unstored->date && (!scheduled || *unstored->date < *scheduled)) scheduled = unstored->date;
  if (scheduled && *date >= *scheduled) return;
  if (scheduled) {
    platform_.log.standard("Re-scheduling conversion outreach %@", *date);
  } else {
    platform_.log.standard("scheduling conversion outreach %@", *date);
  }
  KVRScheduler::newSchedulerWithActivityDelegate(platform_,
                                                 std::make_shared<KVRConversionOutreachActivity>(platform_))
      ->scheduleActivityForDate(date);
  platform_.preferences.setObject(*date, preference::kConversionOutreachScheduledDate);
  const bool isStored =
      platform_.preferences.dateForKey(preference::kConversionOutreachScheduledDate) == date;
  unstored->date = isStored ? std::nullopt : date;
}

}  // namespace kvr
