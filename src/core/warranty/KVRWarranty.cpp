#include "core/warranty/KVRWarranty.h"

#include "core/warranty/WarrantyKeys.h"
#include "platform/value/EpochNumber.h"

#include <cmath>
#include <limits>

namespace kvr {
namespace {

constexpr double kSecondsPerDay = 86400.0;

double daysToSeconds(const Value& days) { return days.asDouble() * kSecondsPerDay; }

bool isCodable(const Value& tree) {
  switch (tree.kind()) {
    case Value::Kind::Data:
      return false;
    case Value::Kind::Array:
      for (const auto& element : tree.array()) {
        if (!isCodable(element)) return false;
      }
      return true;
    case Value::Kind::Dictionary:
      for (const auto& [key, element] : tree.dictionary()) {
        if (!isCodable(element)) return false;
      }
      return true;
    default:
      return true;
  }
}

/// Fills the one object placeholder ("%@", or "%1$@" where a translation numbers it) of a text from the
/// service; "%%" is a percent sign, and nothing else in it means anything.
std::string fillPlaceholder(const std::string& format, const std::string& text) {
  std::string filled;
  bool used = false;
  for (std::size_t at = 0; at < format.size();) {
    const auto rest = std::string_view(format).substr(at);
    const std::size_t placeholder = rest.starts_with("%@") ? 2 : rest.starts_with("%1$@") ? 4 : 0;
    if (placeholder != 0 && !used) {
      filled += text;
      used = true;
      at += placeholder;
    } else if (rest.starts_with("%%")) {
      filled += '%';
      at += 2;
    } else {
      filled += format[at++];
    }
  }
  return filled;
}

}  // namespace

std::shared_ptr<KVRWarranty> KVRWarranty::initWithDictionary(Platform& platform, const Value& dictionary,
                                                             const std::optional<std::string>&) {
  if (!dictionary.isDictionary()) return nullptr;
  return std::shared_ptr<KVRWarranty>(new KVRWarranty(platform, dictionary));
}

std::shared_ptr<KVRWarranty> KVRWarranty::warrantyWithDictionary(
    Platform& platform, const Value& dictionary, const std::optional<std::string>& serialNumber) {
  auto warranty = initWithDictionary(platform, dictionary, serialNumber);
  platform.log.standard("%s : %d", "+[KVRWarranty warrantyWithDictionary:serialNumber:]",
                        warranty != nullptr);
  return warranty;
}

std::shared_ptr<KVRWarranty> KVRWarranty::initWithCoder(Platform& platform, const Value& coded) {
  const Value& dictionary = coded[kCodingKey];
  if (!isCodable(dictionary)) return nullptr;
  return initWithDictionary(platform, dictionary);
}

Value KVRWarranty::encodeWithCoder() const {
  return Value::Dictionary{{kCodingKey, dictionaryRepresentation()}};
}

KVRWarranty::KVRWarranty(Platform& platform, const Value& dictionary)
    : dictionaryRepresentation(dictionary), platform_(platform) {
  readTopLevel(dictionary);
  readFeatureToggles(dictionary);
  readPlan(dictionary);
  zubOfferConversionDate = conversionDate(dictionary);
  readCoverageCard(dictionary);
  displayRepairAndSupport = dictionary["displayRepairAndSupport"].asBool();
  quorURL = dictionary["quorURL"];
  supportAppURL = dictionary["supportAppURL"];
}

void KVRWarranty::readTopLevel(const Value& dictionary) {
  covered = dictionary["covered"].asBool();
  coverageEndDate = _dateWithEpochNumber(dictionary["coverageEndDate"]);
  localizedCoveredDeviceDateLabelFormat = dictionary["localizedCoveredDeviceDateLabelFormat"];
  coverageLocalizedLabel = dictionary["coverageLocalizedLabel"];
  coverageLocalizedDesc = dictionary["coverageLocalizedDesc"];
  coverageLocalizedDescLong = dictionary["coverageLocalizedDescLong"];
  coverageLocalizedExpirationLabel = dictionary["coverageLocalizedExpirationLabel"];
  footer1FormatString = dictionary["footer1FormatString"];
  footer1LinkLabel = dictionary["footer1LinkLabel"];
  footer1LinkURL = dictionary["footer1LinkURL"];
  footer2FormatString = dictionary["footer2FormatString"];
  footer2LinkLabel = dictionary["footer2LinkLabel"];
  footer2LinkURL = dictionary["footer2LinkURL"];
  zubOfferEligible = dictionary["zubOfferEligible"].asBool();
  zubOfferEligibleUntil = _dateWithEpochNumber(dictionary["zubOfferEligibleUntil"]);
  zubOfferFollowupDisplayDate = _dateWithEpochNumber(dictionary["zubOfferFollowupDisplayDate"]);
  zubOfferDisplayDate = _dateWithEpochNumber(dictionary["zubOfferDisplayDate"]);
  zubOfferIdentifier = dictionary["zubOfferIdentifier"];
  zubLocalizedOfferLabel = dictionary["zubLocalizedOfferLabel"];
  zubLocalizedOfferPluralDescFormat = dictionary["zubLocalizedOfferPluralDescFormat"];
  zubLocalizedOfferSingularDesc = dictionary["zubLocalizedOfferSingularDesc"];
  zubLocalizedOfferCTA = dictionary["zubLocalizedOfferCTA"];
  zubLocalizedOfferDetails = dictionary["zubLocalizedOfferDetails"];
  zubLocalizedOfferDetailsPluralEligibilityFormat =
      dictionary["zubLocalizedOfferDetailsPluralEligibilityFormat"];
  zubLocalizedOfferDetailsSingularEligibility = dictionary["zubLocalizedOfferDetailsSingularEligibility"];
}

void KVRWarranty::readFeatureToggles(const Value& dictionary) {
  const Value& toggles = dictionary["featureToggleParameters"];
  zubOfferDisplay = toggles["zubOfferDisplay"].asBool();
  zubOfferSettingsAppBadge = toggles["zubOfferSettingsAppBadge"].asBool();
  zubOfferSettingsRowBadge = toggles["zubOfferSettingsRowBadge"].asBool();
  zubOfferDurationBeforeEndDate = daysToSeconds(toggles["zubOfferDurationDaysBeforeEndDate"]);
  zubOfferToggle = toggles["zubOfferToggle"];
}

void KVRWarranty::readPlan(const Value& dictionary) {
  zubOfferBadgeDurationBeforeEndDate = daysToSeconds(dictionary["zubOfferBadgeBeforeEndDate"]);
  coverageHasZUBLogo = dictionary["zubLogoToggle"].asBool();
  localizedCoverageSubTitleForServicesPartnerString = dictionary["zubServicesPartner"];
  localizedSupportAppLabel = dictionary["localizedSupportAppLabel"];
  localizedSupportAppFooter = dictionary["localizedSupportAppFooter"];
  localizedManagePlanLabel = dictionary["localizedManagePlanLabel"];
  zubOfferBadgeDaysBeforeEndDate = dictionary["zubOfferBadgeBeforeEndDate"];
  isCoveragePlanSubscriptionType = dictionary["isZubSubscription"].asBool();
  isZUBServicesPartner = dictionary["isZubServicesPartner"].asBool();
}

void KVRWarranty::readCoverageCard(const Value& dictionary) {
  const Value& coverage = dictionary["coverage"];
  coverageDetailsDictionary = coverage;
  localizedCoverageDetailsTitle = coverage["localizedCoverageTitle"];
  coverageDetailsArray = coverage["coverageDetails"];
  localizedCoverageFooterFormatString = coverage["localizedCoverageFooterFormatString"];
  localizedCoverageFooterLinkLabel = coverage["localizedCoverageFooterLinkLabel"];
  const Value& card = coverage["benefitsCard"];
  coverageBenefitsDictionary = card;
  localizedBenefitsCardTitle = card["localizedBenefitsCardTitle"];
  localizedBenefitsCardSubTitle = card["localizedBenefitsCardSubTitle"];
  benefitDetailsArray = card["benefitDetails"];
  localizedBenefitsCardFooter = card["localizedBenefitsCardFooter"];
}

std::optional<Date> KVRWarranty::conversionDate(const Value& dictionary) const {
  const auto override = _dateWithEpochNumber(platform_.preferences.objectForKey(preference::kConversionDate));
  if (override) return override;
  if (dictionary.contains("zubOfferConversionDate")) {
    const Value& number = dictionary["zubOfferConversionDate"];
    if (number.asDouble() == 0) return std::nullopt;
    return _dateWithEpochNumber(number);
  }
  const auto end = coverageEndDate();
  if (!end) return std::nullopt;
  return *end + platform_.preferences.doubleForKey(preference::kOneDayInterval);
}

std::uint32_t KVRWarranty::daysEligible() const {
  double day = platform_.preferences.doubleForKey(preference::kOneDayInterval);
  if (!(day > 0)) day = kSecondsPerDay;
  const auto end = zubOfferEligibleUntil();
  const double left = end ? *end - platform_.clock.now() : 0;
  const double days = std::ceil(left / day);
  if (!(days > 0)) return 0;
  if (days >= 4294967296.0) return std::numeric_limits<std::uint32_t>::max();
  return static_cast<std::uint32_t>(days);
}

Value KVRWarranty::zubLocalizedOfferDesc() const {
  const auto days = daysEligible();
  if (days <= 1) return zubLocalizedOfferSingularDesc();
  const Value format = zubLocalizedOfferPluralDescFormat();
  if (format.isString()) return fillPlaceholder(format.string(), platform_.locale.decimalString(days));
  platform_.log.error("zubLocalizedOfferDesc: zubLocalizedOfferPluralDescFormat is not a string");
  return {};
}

Value KVRWarranty::zubLocalizedOfferDetailsEligibility() const {
  const auto days = daysEligible();
  if (days <= 1) return zubLocalizedOfferDetailsSingularEligibility();
  const Value format = zubLocalizedOfferDetailsPluralEligibilityFormat();
  if (format.isString()) return fillPlaceholder(format.string(), platform_.locale.decimalString(days));
  platform_.log.error(
      "zubLocalizedOfferDetailsEligibility: zubLocalizedOfferDetailsPluralEligibilityFormat is not a string");
  return {};
}

std::optional<Date> KVRWarranty::_dateWithEpochNumber(const Value& number) {
  return dateWithEpochNumber(number);
}

bool KVRWarranty::isEqual(const KVRWarranty& other) const {
  return dictionaryRepresentation() == other.dictionaryRepresentation();
}

}  // namespace kvr
