#pragma once

#include "platform/Platform.h"
#include "platform/value/AtomicProperty.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace kvr {

class KVRWarranty;
using KVRWarrantyRef = std::shared_ptr<const KVRWarranty>;

/// The coverage and offer state of one device: a typed view over the warranty dictionary.
///
/// The warranty dictionary is what the coverage service sends, what the cache file holds and what clients
/// receive. The record keeps it whole (`dictionaryRepresentation`) and copies, once, at construction, what
/// the agent and its clients need into properties. Equality, description and coding are the dictionary's. In
/// it, dates are epoch numbers and durations are day counts. Texts, arrays and dictionaries are kept as they
/// come, without a type check. A record is null only if there is no dictionary; a value of the wrong kind
/// counts as an absent property.
///
/// Read and written from any thread, property by property.
class KVRWarranty {
 public:
  static constexpr const char* kCodingKey = "DictionaryRepresentation";

  /// Makes a record; null without a dictionary. The serial number is accepted but not stored.
  static std::shared_ptr<KVRWarranty> initWithDictionary(Platform& platform, const Value& dictionary,
                                                         const std::optional<std::string>& serialNumber = {});
  /// The same, logged; for what came from the service or from a cache file.
  static std::shared_ptr<KVRWarranty> warrantyWithDictionary(
      Platform& platform, const Value& dictionary, const std::optional<std::string>& serialNumber = {});
  static constexpr bool supportsSecureCoding() { return true; }
  /// A record from its coded form; null unless it holds a dictionary that consists of dictionaries, arrays,
  /// strings, numbers, dates and nulls only.
  static std::shared_ptr<KVRWarranty> initWithCoder(Platform& platform, const Value& coded);
  /// The coded form: one entry, the dictionary.
  Value encodeWithCoder() const;

  // --- the cache: one property list per device, KVRWarrantyCache.cpp ---

  /// The cached record of a device (of the legacy file for no serial number), read afresh; null for none.
  static std::shared_ptr<KVRWarranty> cachedWarrantyForSerialNumber(
      Platform& platform, const std::optional<std::string>& serialNumber);
  /// Replaces the device's cache file. A dictionary that the file cannot hold is not written; no failure is
  /// reported.
  void cacheWarranty(const std::optional<std::string>& serial) const;
  void cache() const { cacheWarranty(std::nullopt); }
  /// Moves the single cache file of the earlier layout and its three preferences to the names for this
  /// device.
  static std::shared_ptr<KVRWarranty> migrateLegacyCachedWarrantyIfNeededForSerialNumber(
      Platform& platform, const std::string& serialNumber);
  /// The per-device path, still holding its placeholder "%@" for the serial hash.
  static std::string _warrantyPathForSerialNumberFormat(Platform& platform);
  static std::string _legacyWarrantyPath(Platform& platform);

  // --- computed by each call, from the clock and the "OneDayInterval" preference ---

  /// Whole days until the eligibility ends, rounded up; 0 when it has ended or there is no end.
  std::uint32_t daysEligible() const;
  /// The offer text for the days left; null when the service sent none that fits.
  Value zubLocalizedOfferDesc() const;
  Value zubLocalizedOfferDetailsEligibility() const;

  /// As `dateWithEpochNumber`.
  static std::optional<Date> _dateWithEpochNumber(const Value& number);

  bool isEqual(const KVRWarranty& other) const;
  std::string description() const { return describe(dictionaryRepresentation()); }

  // --- properties; a text is the value under its key, of any kind, or null ---

  AtomicProperty<bool> covered;
  AtomicProperty<std::optional<Date>> coverageEndDate;
  AtomicProperty<std::optional<Date>> coverageValidityDate;  ///< never filled here
  AtomicProperty<Value> localizedCoveredDeviceDateLabelFormat;
  AtomicProperty<Value> coverageLocalizedLabel;
  AtomicProperty<Value> coverageLocalizedDesc;
  AtomicProperty<Value> coverageLocalizedDescLong;
  AtomicProperty<Value> coverageLocalizedExpirationLabel;
  AtomicProperty<Value> footer1FormatString;
  AtomicProperty<Value> footer1LinkLabel;
  AtomicProperty<Value> footer1LinkURL;
  AtomicProperty<Value> footer2FormatString;
  AtomicProperty<Value> footer2LinkLabel;
  AtomicProperty<Value> footer2LinkURL;
  AtomicProperty<bool> zubOfferEligible;
  AtomicProperty<std::optional<Date>> zubOfferEligibleUntil;
  AtomicProperty<std::optional<Date>> zubOfferFollowupDisplayDate;
  AtomicProperty<std::optional<Date>> zubOfferDisplayDate;
  AtomicProperty<Value> zubOfferIdentifier;
  AtomicProperty<Value> zubLocalizedOfferLabel;
  AtomicProperty<Value> zubLocalizedOfferPluralDescFormat;
  AtomicProperty<Value> zubLocalizedOfferSingularDesc;
  AtomicProperty<Value> zubLocalizedOfferCTA;
  AtomicProperty<Value> zubLocalizedOfferDetails;
  AtomicProperty<Value> zubLocalizedOfferDetailsPluralEligibilityFormat;
  AtomicProperty<Value> zubLocalizedOfferDetailsSingularEligibility;
  AtomicProperty<bool> zubOfferDisplay;
  AtomicProperty<bool> zubOfferSettingsAppBadge;
  AtomicProperty<bool> zubOfferSettingsRowBadge;
  AtomicProperty<double> zubOfferDurationBeforeEndDate;       ///< seconds
  AtomicProperty<Value> zubOfferToggle;                       ///< array of carrier IDs
  AtomicProperty<double> zubOfferBadgeDurationBeforeEndDate;  ///< seconds
  AtomicProperty<bool> coverageHasZUBLogo;
  AtomicProperty<Value> localizedCoverageSubTitleForServicesPartnerString;
  AtomicProperty<Value> localizedCoverageFooterFormatString;
  AtomicProperty<Value> localizedCoverageFooterLinkLabel;
  AtomicProperty<Value> localizedSupportAppLabel;
  AtomicProperty<Value> localizedSupportAppFooter;
  AtomicProperty<bool> isCoveragePlanSubscriptionType;
  AtomicProperty<Value> localizedManagePlanLabel;
  AtomicProperty<Value> zubOfferBadgeDaysBeforeEndDate;  ///< days, unconverted
  AtomicProperty<bool> isZUBServicesPartner;
  AtomicProperty<std::optional<Date>> zubOfferConversionDate;
  AtomicProperty<Value> coverageDetailsDictionary;
  AtomicProperty<Value> localizedCoverageDetailsTitle;
  AtomicProperty<Value> coverageDetailsArray;
  AtomicProperty<Value> localizedCoverageDetailsLabel;  ///< never filled here
  AtomicProperty<Value> localizedCoverageDetailsValue;  ///< never filled here
  AtomicProperty<Value> coverageBenefitsDictionary;
  AtomicProperty<Value> localizedBenefitsCardTitle;
  AtomicProperty<Value> localizedBenefitsCardSubTitle;
  AtomicProperty<Value> benefitDetailsArray;
  AtomicProperty<Value> localizedBenefitLabelKey;  ///< never filled here
  AtomicProperty<Value> localizedBenefitValueKey;  ///< never filled here
  AtomicProperty<Value> localizedBenefitsCardFooter;
  AtomicProperty<bool> displayRepairAndSupport;
  AtomicProperty<Value> quorURL;
  AtomicProperty<Value> supportAppURL;
  AtomicProperty<Value> dictionaryRepresentation;
  AtomicProperty<std::optional<std::string>> serialNumber;  ///< never filled here

 private:
  KVRWarranty(Platform& platform, const Value& dictionary);

  void readTopLevel(const Value& dictionary);
  void readFeatureToggles(const Value& dictionary);
  void readPlan(const Value& dictionary);
  void readCoverageCard(const Value& dictionary);
  std::optional<Date> conversionDate(const Value& dictionary) const;

  Platform& platform_;
};

}  // namespace kvr
