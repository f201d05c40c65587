#include "kvr-simulate/World.h"

#include "core/followup/FollowUpKeys.h"
#include "core/warranty/WarrantyKeys.h"
#include "kvr-simulate/Epochs.h"
#include "platform/codec/PropertyList.h"
#include "platform/names/Names.h"

#include <algorithm>

namespace kvr::simulate {
namespace {

constexpr double kDay = 86400;
constexpr const char* kTokenService = "com.tarsil.vornic.supportapp.auth";

std::string newSerialNumber(Dice& dice) {
  constexpr std::string_view kDigits = "BCDFGHJKLMNPQRSTVWXYZ23456789";
  std::string text = "SN";
  for (int count = 0; count < 10; ++count) text += kDigits[dice.below(kDigits.size())];
  return text;
}

}  // namespace

World::World(std::uint64_t theSeed)
    : seed(theSeed), dice(theSeed ^ 0x5EEDULL), phone(newSerialNumber(dice)), service(theSeed ^ 0x5E41CEULL) {
  const Date birth = SimulatedClock::kDefaultStart;
  for (auto count = dice.below(4); count > 0; --count) {
    const Date paired = birth - dice.between(0, 100) * kDay;
    watches.push_back({newSerialNumber(dice), paired, paired, dice.happens(0.7), dice.happens(0.1)});
  }
  for (const auto& serialNumber : serialNumbers()) service.publish(drawOffer(dice, serialNumber, birth));
  hasAccount = dice.happens(0.9);
}

Offer World::drawOffer(Dice& from, const std::string& serialNumber, Date today) const {
  Offer offer;
  offer.serialNumber = serialNumber;
  offer.isOffered = from.happens(0.75);
  offer.isCovered = from.happens(0.5);
  const auto sends = [&](const char* key, double probability, double leastDays, double mostDays) {
    if (from.happens(probability)) offer.epochs.emplace(key, drawEpoch(from, today, leastDays, mostDays));
  };
  sends("zubOfferEligibleUntil", 0.95, -3, 70);
  sends("zubOfferFollowupDisplayDate", 0.7, -20, 40);
  sends("zubOfferConversionDate", 0.5, -20, 60);
  sends("coverageEndDate", 0.3, -20, 400);
  if (from.happens(0.7)) offer.daysBeforeEnd = from.between(0, 60);
  return offer;
}

std::vector<std::string> World::serialNumbers() const {
  std::vector<std::string> list{phone};
  for (const auto& watch : watches) list.push_back(watch.serialNumber);
  return list;
}

std::vector<std::string> World::trackedSerialNumbers() const {
  std::vector<std::string> list{phone};
  for (const auto& watch : watches) {
    if (watch.isPaired && !watch.isArchived) list.push_back(watch.serialNumber);
  }
  return list;
}

const World::Watch* World::watch(const std::string& serialNumber) const {
  const auto found = std::find_if(watches.begin(), watches.end(), [&](const Watch& candidate) {
    return candidate.serialNumber == serialNumber;
  });
  return found == watches.end() ? nullptr : &*found;
}

bool World::isInTrouble() const {
  constexpr double kRenewalLimit = 60;  // seconds; the agent does not wait any longer for a new token
  return !hasAccount || !isNetworkReachable || renewal.never || renewal.delay > kRenewalLimit ||
         renewal.resultCode != 0 || service.coverageFault != Service::Fault::None ||
         service.versionFault != Service::Fault::None;
}

void World::show(SimulatedPlatform& platform) const {
  platform.accounts.primary = hasAccount ? std::optional(CloudAccount{"alt-dsid"}) : std::nullopt;
  platform.accounts.authentication = AuthenticationAccount{"alternate-dsid"};
  platform.accounts.store = StoreAccount{42, "143441"};
  if (platform.accounts.tokens.empty()) platform.accounts.tokens = {{kTokenService, heldToken}};
  platform.accounts.renewal = renewal;
  platform.accounts.renewal.tokens = {{kTokenService, service.validToken}};
  platform.attestation.preferred =
      hasAttestation
          ? SimulatedDeviceAttestation::issued(platform.attestation.key, {std::string(600, 'c')}, 0.5)
          : attestation;
  platform.deviceProperties.answers = {{"SerialNumber", phone},
                                       {"UserAssignedDeviceName", "Phone"},
                                       {"ProductType", "Phone1,2"},
                                       {"ProductVersion", "17." + std::to_string(systemVersion)}};
  platform.activities.boot = "boot " + std::to_string(boot);
  platform.activities.setNetworkReachable(isNetworkReachable);
  platform.locale.identifier = locale;
  platform.featureFlags.enabled.insert({"Kavrel", "Bravik_3_0"});
  platform.pairedDevices.devices.clear();
  for (const auto& watch : watches) {
    platform.pairedDevices.devices.push_back(
        {"Watch", {}, watch.serialNumber, watch.paired, watch.isPaired, watch.isArchived});
  }
}

void World::putLegacyFiles(SimulatedFiles& files) {
  const auto number = service.currentOf(phone);
  service.at(number).lastServed = 0;
  const std::string home = files.homeDirectory();
  files.put(home + "/Library/Application Support/com.tarsil.Kavrel/Warranty.plist",
            *writePropertyList(service.treeOf(number), PropertyListEncoding::XML));
  files.putPropertyList(home + "/Library/Preferences/com.tarsil.kvragent.plist",
                        Value::Dictionary{{names::kLastUpdatedDate, SimulatedClock::kDefaultStart - 100},
                                          {preference::kCachedWarrantyLocale, locale},
                                          {preference::kCachedWarrantyVersion, "2"}});
  files.putPropertyList(
      home + "/Library/FollowUps/" + names::kFollowUpClient + ".plist",
      Value::Dictionary{{"items", Value::Array{Value::Dictionary{{"uniqueIdentifier", names::kFollowUpClient},
                                                                 {"title", Service::labelOf(number)},
                                                                 {"displayStyle", 2},
                                                                 {"userInfo", Value::Dictionary{}},
                                                                 {"actions", Value::Array{}}}}}});
}

}  // namespace kvr::simulate
