#include "core/warranty/KVRServerVersionUtilities.h"

#include "core/warranty/WarrantyKeys.h"
#include "platform/codec/PropertyList.h"
#include "platform/text/URL.h"

#include <algorithm>

namespace kvr {
namespace {

constexpr std::size_t kLargestAsset = std::size_t{1} << 20U;  // bytes
/// What is kept of an asset goes into the preferences, which are read at every question: they have to stay
/// small enough to be remembered once they are parsed.
constexpr TreeExtent kLargestKept{std::size_t{1} << 17U, std::size_t{1} << 20U};
constexpr std::size_t kLargestStored = std::size_t{2} << 20U;  // bytes
constexpr std::string_view kVersionKeys[] = {preference::kLowServerVersion, preference::kHighServerVersion};

/// A string's leading digits as a number; anything else as it is.
Value asVersion(const Value& value) { return value.isString() ? Value(value.asInteger()) : value; }

Value clientVersions(Platform& platform) {
  const auto& preferences = platform.preferences;
  return Value::Dictionary{
      {preference::kLowServerVersion, preferences.integerForKey(preference::kLowServerVersion)},
      {preference::kHighServerVersion, preferences.integerForKey(preference::kHighServerVersion)},
  };
}

/// The version under `key`, or null and an error in the log.
Value versionIn(Platform& platform, const Value& pair, const char* key) {
  auto version = asVersion(pair[key]);
  if (version.isNull()) platform.log.error("Server version dictionary missing key '%@'", key);
  return version;
}

/// The versions that the client shares with the service whose pair is `server`; nothing for a malformed pair.
std::optional<VersionSet> evaluate(Platform& platform, const Value& server) {
  auto& log = platform.log;
  log.standard("Server version  %@", server);
  if (server.isNull()) {
    log.error("No server version dictionary found");
    return std::nullopt;
  }
  if (!server.isDictionary()) {
    log.error("Incorrect serverDictionary format");
    return std::nullopt;
  }
  const auto low = versionIn(platform, server, preference::kLowServerVersion);
  if (low.isNull()) return std::nullopt;
  const auto high = versionIn(platform, server, preference::kHighServerVersion);
  if (high.isNull()) return std::nullopt;

  VersionSet serverSet;
  serverSet.insert(low);
  serverSet.insert(high);
  log.standard("Server versions '%@'", serverSet);
  VersionSet clientSet;
  clientSet.insert(platform.preferences.integerForKey(preference::kLowServerVersion));
  clientSet.insert(platform.preferences.integerForKey(preference::kHighServerVersion));
  log.standard("Client versions '%@'", clientSet);
  auto shared = clientSet.intersectedWith(serverSet);
  log.standard("clientAndServerSet '%@'", shared);
  return shared;
}

Value serverVersionURL(Platform& platform) {
  return platform.preferences.objectForKey(preference::kServerVersionURL);
}

}  // namespace

void VersionSet::insert(const Value& version) {
  if (!contains(version)) versions_.push_back(version);
}

bool VersionSet::contains(const Value& version) const {
  return std::find(versions_.begin(), versions_.end(), version) != versions_.end();
}

VersionSet VersionSet::intersectedWith(const VersionSet& other) const {
  VersionSet shared;
  for (const auto& version : versions_) {
    if (other.contains(version)) shared.insert(version);
  }
  return shared;
}

std::string VersionSet::description() const {
  const auto list = describe(versions_);
  return "{" + list + "}";
}

void KVRServerVersionUtilities::serverVersionSupported(Platform& platform, const BoolCompletion& completion) {
  _supportedVersionsForClientAndServer(
      platform, ServerLookupPolicy::kRefresh,
      VersionsCompletion(platform.log, "serverVersionSupported", [&platform, completion](const auto& shared) {
        const bool supported = shared && !shared->isEmpty();
        if (supported) platform.log.standard("Server version supported by client version - '%@'", *shared);
        completion(supported);
      }));
}

void KVRServerVersionUtilities::isHighServerVersionFeaturesetEnabled(Platform& platform, std::uint64_t policy,
                                                                     const BoolCompletion& withCompletion) {
  _supportedVersionsForClientAndServer(
      platform, policy,
      VersionsCompletion(
          platform.log, "isHighServerVersionFeaturesetEnabled",
          [&platform, withCompletion](const auto& shared) {
            const auto high = platform.preferences.integerForKey(preference::kHighServerVersion);
            const bool enabled = shared && shared->contains(high);
            platform.log.standard("High Server version supported - %@", enabled ? "YES" : "NO");
            withCompletion(enabled);
          }));
}

void KVRServerVersionUtilities::isHighServerVersionFeaturesetEnabled(Platform& platform,
                                                                     const BoolCompletion& completion) {
  isHighServerVersionFeaturesetEnabled(platform, ServerLookupPolicy::kDefault, completion);
}

bool KVRServerVersionUtilities::isHighServerVersionFeaturesetEnabled(Platform& platform) {
  bool enabled = false;
  isHighServerVersionFeaturesetEnabled(platform, ServerLookupPolicy::kCacheOnly,
                                       BoolCompletion(platform.log, "isHighServerVersionFeaturesetEnabled",
                                                      [&](bool answer) { enabled = answer; }));
  return enabled;
}

Value KVRServerVersionUtilities::readWebURLOverride(Platform& platform) {
  platform.log.standard("%s", "+[KVRServerVersionUtilities readWebURLOverride]");
  return platform.preferences.objectForKey(preference::kWebFlowURL);
}

Value KVRServerVersionUtilities::_getValidServerVersionCache(Platform& platform) {
  auto cached = platform.preferences.objectForKey(preference::kServerVersionCache);
  if (cached.isNull() || cached.isDictionary()) return cached;
  platform.log.error("Incorrect format stored in server version cache. Removing it.");
  platform.preferences.removeObject(preference::kServerVersionCache);
  return {};
}

namespace {

/// One negotiation: its inputs and its completion.
struct Negotiation {
  Platform& platform;
  std::uint64_t policy;
  Value cached;  ///< null for none
  KVRServerVersionUtilities::VersionsCompletion completion;

  void use(VersionSource source, const Value& pair) const {
    if (storesPair(policy, source)) {
      platform.preferences.setObject(pair, preference::kServerVersionCache);
      if (source != VersionSource::Override) platform.log.standard("Caching Server version  %@", pair);
    }
    completion(evaluate(platform, pair));
  }

  /// Uses the first of these sources that has a pair.
  void tryInOrder(std::span<const VersionSource> sources) const {
    const auto source = sources.front();
    const auto others = sources.subspan(1);
    switch (source) {
      case VersionSource::Override:
        break;
      case VersionSource::Cache:
        if (cached.isNull()) return tryInOrder(others);
        if (policy == ServerLookupPolicy::kCacheOnly) {
          platform.log.standard("Using Cached Server version: %@", cached);
        }
        return use(source, cached);
      case VersionSource::Asset:
        return KVRServerVersionUtilities::_dictionaryFromURL(
            platform, serverVersionURL(platform), true,
            KVRServerVersionUtilities::DictionaryCompletion(
                platform.log, "_supportedVersionsForClientAndServer",
                [self = *this, source, others](const Value& pair) {
                  pair.isNull() ? self.tryInOrder(others) : self.use(source, pair);
                }));
      case VersionSource::ClientVersions: {
        const auto pair = clientVersions(platform);
        platform.log.standard("Using Client version: %@", pair);
        return use(source, pair);
      }
    }
  }
};

}  // namespace

void KVRServerVersionUtilities::_supportedVersionsForClientAndServer(
    Platform& platform, std::uint64_t policy, const VersionsCompletion& withCompletion) {
  const auto override = platform.preferences.objectForKey(preference::kServerVersionOverride);
  platform.log.standard(" Server lookup policy:%ld", policy);
  Negotiation negotiation{platform, policy, {}, withCompletion};
  if (!override.isNull()) {
    platform.log.standard("Using Overridden Server version  %@", override);
    negotiation.use(VersionSource::Override, override);
    return;
  }
  negotiation.cached = _getValidServerVersionCache(platform);
  negotiation.tryInOrder(versionSources(policy));
}

namespace {

using DictionaryCompletion = KVRServerVersionUtilities::DictionaryCompletion;

/// The result of a fetch: the bytes, or the error.
using Fetched = Result<std::string>;

/// Whether the asset can be stored as an entry of the preferences, which makes it one level deeper.
bool canBeKept(const Value& asset) {
  const auto stored = writePropertyList(Value::Dictionary{{preference::kServerVersionCache, asset}},
                                        PropertyListEncoding::Binary);
  return stored && stored->size() <= kLargestStored;
}

/// Reduces an asset that is too large to store to its versions, as numbers.
Value versionsOf(Platform& platform, const Value& url, const Value& asset) {
  platform.log.error("The asset from URL '%@' holds more than can be kept: only its versions are", url);
  if (!asset.isDictionary()) return asset;
  Value::Dictionary versions;
  for (const auto& key : kVersionKeys) {
    if (const auto& version = asset[key]; !version.isNull()) versions.emplace(key, asVersion(version));
  }
  return versions;
}

void handleFetched(Platform& platform, const Value& url, bool shouldRetry, const Fetched& fetched,
                   const DictionaryCompletion& completion) {
  if (!fetched) {
    platform.log.error("Failed to fetch plist data from URL '%@' with error: %@", url, fetched.error());
    completion({});
    return;
  }
  const auto parsed = readPropertyListWithin(kLargestKept, *fetched, kVersionKeys);
  if (!parsed) {
    platform.log.error("Error serializing plist file from URL '%@': %@", url, parsed.error());
    completion({});
    return;
  }
  const bool isKept = parsed->isWhole && canBeKept(parsed->tree);
  const Value asset = isKept ? parsed->tree : versionsOf(platform, url, parsed->tree);
  if (asset.isDictionary()) {
    completion(asset);
  } else if (shouldRetry) {
    platform.log.error("Incorrect format in response detected. retrying...");
    KVRServerVersionUtilities::_dictionaryFromURL(platform, url, false, completion);
  } else {
    platform.log.error(
        "Incorrect format in response detected from URL '%@'. Response: %@. Aborting without retry.", url,
        asset);
    completion({});
  }
}

Fetched readFile(Platform& platform, const std::string& path) {
  const auto contents = platform.files.read(path, kLargestAsset);
  if (!contents) return contents.error();
  if (!*contents) return Error{"files", 0, "no such file"};
  return (*contents)->bytes;
}

Fetched bodyOf(const HTTPResponse& response) {
  if (response.body) return *response.body;
  return response.error.value_or(Error{"http", 0, "no data"});
}

}  // namespace

void KVRServerVersionUtilities::_dictionaryFromURL(Platform& platform, const Value& url, bool shouldRetry,
                                                   const DictionaryCompletion& withCompletion) {
  const auto target = url.isString() ? URL::parse(url.string()) : std::nullopt;
  const auto handle = [&platform, url, shouldRetry, withCompletion](const Fetched& fetched) {
    handleFetched(platform, url, shouldRetry, fetched, withCompletion);
  };
  if (!target || (!target->isFile() && !target->isWeb())) {
    handle(Error{"http", 0, "neither a web address nor a file"});
  } else if (target->isFile()) {
    platform.queues.concurrentQueue(Priority::Default)->async([&platform, path = target->filePath(), handle] {
      handle(readFile(platform, path));
    });
  } else {
    HTTPRequest request;
    request.url = target->text();
    const auto reply = [handle](const HTTPResponse& response) { handle(bodyOf(response)); };
    if (shouldRetry) {
      platform.http.sharedSession().send(std::move(request), reply);
    } else {
      platform.http.newUncachedSession()->send(std::move(request), reply);
    }
  }
}

}  // namespace kvr
