#include "CoverageAnswer.h"

#include <nlohmann/json.hpp>

namespace kvr::bench {
namespace {

constexpr std::size_t kKeys = 60;
constexpr const char* kText =
    "Your device is covered for repairs & replacements; see \"terms\" for what that includes.";

/// Adds labels until the answer has its usual size.
void fill(nlohmann::json& answer) {
  for (int number = 1; answer.size() < kKeys; ++number) {
    answer["localizedLabel" + std::to_string(number)] = std::to_string(number) + ". " + kText;
  }
}

}  // namespace

std::string coverageAnswer() {
  nlohmann::json answer = {
      {"covered", true},
      {"coverageEndDate", 4'000'000'000},
      {"coverageLocalizedLabel", "Limited warranty"},
      {"coverageLocalizedDesc", kText},
      {"coverageLocalizedDescLong", std::string(kText) + " " + kText},
      {"coverageLocalizedExpirationLabel", "Expires"},
      {"localizedCoveredDeviceDateLabelFormat", "Expires: %@"},
      {"footer1FormatString", "Learn more at %@"},
      {"footer1LinkLabel", "the coverage page"},
      {"footer1LinkURL", "https://coverage.tarsil.example/footer/1"},
      {"footer2FormatString", "Questions? %@"},
      {"footer2LinkLabel", "Ask the support"},
      {"footer2LinkURL", "https://coverage.tarsil.example/footer/2"},
      {"zubOfferEligible", false},
      {"zubOfferEligibleUntil", 3'900'000'000},
      {"zubOfferIdentifier", "offer-4711"},
      {"zubLocalizedOfferLabel", "Add the plan"},
      {"zubLocalizedOfferPluralDescFormat", "%@ days left to add it"},
      {"zubLocalizedOfferSingularDesc", "One day left to add it"},
      {"zubLocalizedOfferCTA", "Add"},
      {"zubLocalizedOfferDetails", kText},
      {"zubOfferBadgeBeforeEndDate", 20},
      {"zubLogoToggle", false},
      {"isZubSubscription", false},
      {"isZubServicesPartner", false},
      {"zubOfferConversionDate", 4'000'086'400},
      {"localizedSupportAppLabel", "Get support"},
      {"localizedSupportAppFooter", "In the support application"},
      {"localizedManagePlanLabel", "Manage plan"},
      {"displayRepairAndSupport", true},
      {"supportAppURL", "supportapp://device"},
      {"quorURL", "https://coverage.tarsil.example/quor"},
      {"featureToggleParameters",
       {{"zubOfferDisplay", false},
        {"zubOfferSettingsAppBadge", false},
        {"zubOfferSettingsRowBadge", true},
        {"zubOfferDurationDaysBeforeEndDate", 60},
        {"zubOfferToggle", {"310-410", "310-260"}}}},
      {"coverage",
       {{"localizedCoverageTitle", "Coverage"},
        {"coverageDetails",
         {{{"label", "Hardware"}, {"value", "Covered"}}, {{"label", "Technical"}, {"value", "Expired"}}}},
        {"localizedCoverageFooterFormatString", "See %@"},
        {"localizedCoverageFooterLinkLabel", "details"},
        {"benefitsCard",
         {{"localizedBenefitsCardTitle", "Benefits"},
          {"localizedBenefitsCardSubTitle", kText},
          {"benefitDetails", {{{"label", "Screen"}, {"value", "2 left"}}}},
          {"localizedBenefitsCardFooter", kText}}}}},
  };
  fill(answer);
  return answer.dump();
}

}  // namespace kvr::bench
