#pragma once

#include "core/agent/Activities.h"
#include "core/agent/Configuration.h"
#include "core/warranty/WarrantyKeys.h"
#include "platform/text/SHA256Hash.h"
#include "unit/SimulatedTest.h"

namespace kvr {

/// A phone whose owner is signed in, with the agent's defaults and two endpoints: `asset` is the version
/// asset, and `coverage` answers coverage requests (if empty, they are never answered).
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
    kvr_registerDefaults(preferences);
    http.handler = [this](const HTTPRequest& request, bool, const SimulatedHTTP::Answer& answer) {
      if (request.url.ends_with("/kvrV2.plist")) {
        answer({200, asset, {}});
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

  std::string asset = "{ LowServerVersion = 2; HighServerVersion = 3; }";
  std::function<HTTPResponse(const HTTPRequest&)> coverage;
};

using CoverageTest = TestIn<CoverageWorld>;

}  // namespace kvr
