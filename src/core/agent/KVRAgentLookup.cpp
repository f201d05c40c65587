// The lookup policy of KVRAgent: cache or download, and what to answer when the download yields nothing.

#include "core/agent/KVRAgent.h"
#include "core/warranty/WarrantyKeys.h"

namespace kvr {
namespace {

constexpr const char* kOperation = "-[KVRAgent getWarrantyUsingPolicy:serialNumber:withReply:]";

void logValidity(Log& log, const std::string& serialNumber, const CacheFacts& facts, CacheValidity validity) {
  if (facts.present) log.standard("Has cached warranty : %@", serialNumber);
  switch (validity) {
    case CacheValidity::None:
      log.standard("no cached warranty : %@", serialNumber);
      break;
    case CacheValidity::OutdatedVersion:
      log.standard(
          "cached warranty is of outdated version '%@', current version is '%@', consider it invalid",
          facts.version, kCacheFormatVersion);
      break;
    case CacheValidity::OtherLocale:
      log.standard("cached warranty is for locale '%@', system is now in '%@', consider it invalid",
                   facts.locale, facts.preferredLocale);
      break;
    case CacheValidity::SignedOut:
      log.standard("user is signed out of Nimbra, cached warranty not allowed");
      break;
    case CacheValidity::Valid:
      log.standard("cached warranty is for locale ('%@') and version ('%@') match system, consider it valid",
                   facts.locale, facts.version);
      break;
  }
}

/// Logs what the default policy decides on: whether the cache is valid and still fresh.
void logFreshness(Log& log, const CacheVerdict& verdict) {
  if (!verdict.isValid()) {
    log.standard("Default policy query: cached warranty is invalid, refresh it");
    return;
  }
  log.standard("Default policy query: cached warranty is valid, examine expiration date");
  if (!verdict.secondsFresh) {
    log.standard("warranty validity expired, refresh it");
  } else if (*verdict.secondsFresh > 0) {
    log.standard("warranty valid for %.02f seconds", *verdict.secondsFresh);
  } else {
    log.standard("warranty validity expired %.02f seconds ago, refresh it", -*verdict.secondsFresh);
  }
}

}  // namespace

CacheFacts KVRAgent::cacheFacts(KVRAgentWarrantyProvider& provider, const std::string& serialNumber,
                                bool isCached) {
  CacheFacts facts;
  if (!isCached) return facts;
  facts.present = true;
  facts.version = provider.cachedWarrantyVersionForSerialNumber(serialNumber);
  facts.locale = provider.cachedWarrantyLocaleForSerialNumber(serialNumber);
  facts.preferredLocale = platform_.locale.preferredIdentifier();
  facts.signedIn = provider.isSignedInToNimbra();
  facts.updated = provider.lastUpdatedDateForSerialNumber(serialNumber);
  facts.validityDuration = provider.cachedWarrantyValidityDuration();
  return facts;
}

/// Decides from one snapshot of the files. Also returns the warranty to reply with when no download yields
/// one, or null.
std::pair<LookupDecision, KVRWarrantyRef> KVRAgent::decide(std::uint64_t policy,
                                                           KVRAgentWarrantyProvider& provider,
                                                           const std::string& serialNumber) {
  const PropertyListFiles::Look look(platform_.propertyLists);
  const auto cached = provider.cachedWarrantyForSerialNumber(serialNumber);
  const auto facts = cacheFacts(provider, serialNumber, cached != nullptr);
  const auto verdict = judgeCache(facts, platform_.clock.now());
  logValidity(platform_.log, serialNumber, facts, verdict.validity);
  if (policy == LookupPolicy::kDefault) logFreshness(platform_.log, verdict);
  const auto decision = lookupDecision(policy, verdict);
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
