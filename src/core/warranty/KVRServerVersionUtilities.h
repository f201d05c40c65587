#pragma once

#include "core/warranty/VersionRules.h"
#include "platform/Platform.h"
#include "platform/log/Completion.h"

#include <cstdint>
#include <optional>
#include <vector>

namespace kvr {

/// A set of service versions; numbers compare by value.
class VersionSet {
 public:
  void insert(const Value& version);
  bool contains(const Value& version) const;
  bool isEmpty() const { return versions_.empty(); }
  VersionSet intersectedWith(const VersionSet& other) const;
  std::string description() const;

 private:
  std::vector<Value> versions_;
};

/// Negotiates which versions of the coverage service client and service share.
///
/// A version pair is a dictionary with "LowServerVersion" and "HighServerVersion", the two versions that one
/// side speaks. The service publishes its pair as a property-list asset; `storesPair` tells when a pair is
/// cached in the "ServerVersionCache" preference. A lookup policy (`ServerLookupPolicy`) says where the
/// service's pair comes from; the "ServerVersionOverride" preference comes before all else. Completions run
/// before the operation returns when nothing is fetched, else on a work queue of the HTTP session. Any
/// thread; no state.
class KVRServerVersionUtilities {
 public:
  using BoolCompletion = Completion<bool>;
  /// Nothing when the service's pair was malformed.
  using VersionsCompletion = Completion<std::optional<VersionSet>>;
  /// Null when there is no dictionary.
  using DictionaryCompletion = Completion<Value>;

  /// Whether client and service share a version, according to the asset as it is now.
  static void serverVersionSupported(Platform& platform, const BoolCompletion& completion);
  /// Whether the shared versions include the client's highest, which stands for support of paired watches.
  static void isHighServerVersionFeaturesetEnabled(Platform& platform, std::uint64_t policy,
                                                   const BoolCompletion& withCompletion);
  static void isHighServerVersionFeaturesetEnabled(Platform& platform, const BoolCompletion& completion);
  /// The same from what is already known; never sends a request.
  static bool isHighServerVersionFeaturesetEnabled(Platform& platform);
  /// The "WebFlowURL" preference, a value of any kind.
  static Value readWebURLOverride(Platform& platform);

  static void _supportedVersionsForClientAndServer(Platform& platform, std::uint64_t policy,
                                                   const VersionsCompletion& withCompletion);
  /// The cached pair, or null; a cache entry that is not a dictionary is removed.
  static Value _getValidServerVersionCache(Platform& platform);
  /// Fetches a dictionary. If the fetched property list is not one and `shouldRetry` is set, fetches once
  /// more, bypassing every cache.
  static void _dictionaryFromURL(Platform& platform, const Value& url, bool shouldRetry,
                                 const DictionaryCompletion& withCompletion);
};

}  // namespace kvr
