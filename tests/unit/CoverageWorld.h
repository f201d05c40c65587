#pragma once

#include "core/agent/Activities.h"
#include "core/warranty/WarrantyKeys.h"
#include "platform/text/SHA256Hash.h"
#include "unit/SimulatedTest.h"

namespace kvr {

/// A phone whose owner is signed in, with two endpoints: the version asset publishes versions 2 and 3;
/// `coverage` answers coverage requests (if empty, they are never answered).
struct CoverageWorld : SimulatedPlatform {
  static constexpr const char* kLocal = "LOCAL";

  explicit CoverageWorld(std::uint64_t seed = 1) : SimulatedPlatform(seed) {
    registerActivities(platform);
    clock.set(Date{1'800'000'000});
    featureFlags.enabled.insert({"Kavrel", "Bravik_3_0"});
    attestation.preferred = SimulatedDeviceAttestation::issued(attestation.key, {std::string(600, 'c')});
    deviceProperties.answers = {{"SerialNumber", kLocal},
                                {"UserAssignedDeviceName", "Phone"},
                                {"ProductType", "Phone1,2"},
                                {"ProductVersion", "17.9"}};
    preferences.registerDefaults(
        {{preference::kLowServerVersion, 2},
         {preference::kHighServerVersion, 3},
         {preference::kOneDayInterval, 86400},
         {preference::kCachedWarrantyValidityDuration, 86400},
         {preference::kServerVersionURL, "https://assets.example/kvrV2.plist"},
         {preference::kWarrantyURL, "https://coverage.example/api/v3/coverage/summary"},
         {preference::kWearablesWarrantyURL, "https://coverage.example/api/v2/coverage/summary"}});
    http.handler = [this](const HTTPRequest& request, bool, const SimulatedHTTP::Answer& answer) {
      if (request.url.starts_with("https://assets.example/")) {
        answer({200, "{ LowServerVersion = 2; HighServerVersion = 3; }", {}});
      } else if (coverage) {
        answer(coverage(request));
      }
    };
    reset();
  }

  /// Resets accounts, answers and overrides so that every download succeeds.
  void reset() {
    accounts.primary = CloudAccount{"alt-dsid"};
    accounts.authentication = AuthenticationAccount{"alternate-dsid"};
    accounts.store = StoreAccount{42, "143441"};
    accounts.tokens = {{"com.tarsil.vornic.supportapp.auth", "token"}};
    accounts.renewal = {};
    coverage = [](const HTTPRequest&) { return HTTPResponse{200, R"({"covered":true})", {}}; };
    for (const char* key :
         {preference::kServerVersionOverride, preference::kWarrantyURL, preference::kWearablesWarrantyURL}) {
      preferences.removeObject(key);
    }
  }

  void pair(const std::string& serialNumber, Date since = Date{1}) {
    pairedDevices.devices.push_back({"Watch", "Model", serialNumber, since, true, false});
  }

  std::function<HTTPResponse(const HTTPRequest&)> coverage;
};

using CoverageTest = TestIn<CoverageWorld>;

}  // namespace kvr
