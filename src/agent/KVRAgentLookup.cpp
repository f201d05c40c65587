// The lookup policy of KVRAgent: cache or download, and what to answer when the download yields nothing.

#include "agent/KVRAgent.h"
#include "warranty/WarrantyKeys.h"

namespace kvr {
namespace {

constexpr const char* kOperation = "-[KVRAgent getWarrantyUsingPolicy:serialNumber:withReply:]";

}  // namespace

bool KVRAgent::isCacheValid(KVRAgentWarrantyProvider& provider, const std::string& serialNumber,
                            const KVRWarrantyRef& cached) {
  auto& log = platform_.log;
  CacheFacts facts;
  Value version;
  Value cachedLocale;
  std::string locale;
  facts.present = cached != nullptr;
  if (facts.present) {
    log.standard("Has cached warranty : %@", serialNumber);
    version = provider.cachedWarrantyVersionForSerialNumber(serialNumber);
    facts.versionMatches = version == Value(kCacheFormatVersion);
  }
  if (facts.versionMatches) {
    cachedLocale = provider.cachedWarrantyLocaleForSerialNumber(serialNumber);
    locale = platform_.locale.preferredIdentifier();
    facts.localeMatches = cachedLocale == Value(locale);
  }
  if (facts.localeMatches) facts.signedIn = provider.isSignedInToNimbra();

  const auto validity = cacheValidity(facts);
  switch (validity) {
    case CacheValidity::None:
      log.standard("no cached warranty : %@", serialNumber);
      break;
    case CacheValidity::OutdatedVersion:
      log.standard(
          "cached warranty is of outdated version '%@', current version is '%@', consider it invalid",
          version, kCacheFormatVersion);
      break;
    case CacheValidity::OtherLocale:
      log.standard("cached warranty is for locale '%@', system is now in '%@', consider it invalid",
                   cachedLocale, locale);
      break;
    case CacheValidity::SignedOut:
      log.standard("user is signed out of Nimbra, cached warranty not allowed");
      break;
    case CacheValidity::Valid:
      log.standard("cached warranty is for locale ('%@') and version ('%@') match system, consider it valid",
                   cachedLocale, version);
      break;
  }
  return validity == CacheValidity::Valid;
}

/// Only asked by the default policy about a valid cache.
std::optional<double> KVRAgent::secondsFresh(KVRAgentWarrantyProvider& provider,
                                             const std::string& serialNumber) {
  auto& log = platform_.log;
  log.standard("Default policy query: cached warranty is valid, examine expiration date");
  const auto updated = provider.lastUpdatedDateForSerialNumber(serialNumber);
  if (!updated) {
    log.standard("warranty validity expired, refresh it");
    return std::nullopt;
  }
  const double seconds = (*updated - platform_.clock.now()) + provider.cachedWarrantyValidityDuration();
  if (seconds > 0) {
    log.standard("warranty valid for %.02f seconds", seconds);
  } else {
    log.standard("warranty validity expired %.02f seconds ago, refresh it", -seconds);
  }
  return seconds;
}

/// What is made of the cache, from files as they are at one moment; and the warranty that may be answered
/// when no download yields one.
std::pair<LookupDecision, KVRWarrantyRef> KVRAgent::decide(std::uint64_t policy,
                                                           KVRAgentWarrantyProvider& provider,
                                                           const std::string& serialNumber) {
  auto& log = platform_.log;
  const PropertyListFiles::Look look(platform_.propertyLists);
  const auto cached = provider.cachedWarrantyForSerialNumber(serialNumber);
  const bool cacheValid = isCacheValid(provider, serialNumber, cached);
  std::optional<double> fresh;
  if (policy == LookupPolicy::kDefault) {
    if (cacheValid) {
      fresh = secondsFresh(provider, serialNumber);
    } else {
      log.standard("Default policy query: cached warranty is invalid, refresh it");
    }
  }
  const auto decision = lookupDecision(policy, cacheValid, fresh);
  return {decision, decision.cacheMayAnswer ? cached : nullptr};
}

void KVRAgent::getWarrantyUsingPolicy(std::uint64_t policy, const std::optional<std::string>& serialNumber,
                                      const WarrantyReply& withReply) {
  auto& log = platform_.log;
  if (!serialNumber) {
    log.error("%s: the device has no serial number", kOperation);
    withReply(nullptr);
    return;
  }
  const auto provider = warrantyProvider();
  const auto& serial = *serialNumber;
  log.standard("getting warranty using policy %@: %lu", serial, policy);
  const auto [decision, fallback] = decide(policy, *provider, serial);
  log.standard("%s: shouldDownloadWarranty: %d", kOperation, decision.downloads);

  const auto complete = [self = shared_from_this(), serial, fallback = fallback,
                         withReply](const KVRWarrantyRef& downloaded) {
    self->platform_.log.standard("getWarrantyUsingPolicy completionBlock %{private}@ : %d", serial,
                                 downloaded != nullptr);
    withReply(downloaded ? downloaded : fallback);
  };
  if (!decision.downloads) {
    complete(nullptr);
    return;
  }
  provider->downloadWarrantyForSerialNumber(
      serial,
      DownloadCompletion(log, "getWarrantyUsingPolicy",
                         [complete](bool, const KVRWarrantyRef& downloaded) { complete(downloaded); }));
}

void KVRAgent::getWarrantyUsingPolicy(std::uint64_t policy, const WarrantyReply& withReply) {
  getWarrantyUsingPolicy(policy, deviceProvider()->defaultDevice()->serialNumber(), withReply);
}

}  // namespace kvr
