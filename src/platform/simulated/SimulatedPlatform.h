#pragma once

#include "platform/FileFollowUpCenter.h"
#include "platform/FilePreferences.h"
#include "platform/Platform.h"
#include "platform/simulated/SimulatedAccountStore.h"
#include "platform/simulated/SimulatedActivityScheduler.h"
#include "platform/simulated/SimulatedCarrierInfo.h"
#include "platform/simulated/SimulatedCleanExit.h"
#include "platform/simulated/SimulatedClock.h"
#include "platform/simulated/SimulatedDeviceAttestation.h"
#include "platform/simulated/SimulatedDeviceProperties.h"
#include "platform/simulated/SimulatedFeatureFlags.h"
#include "platform/simulated/SimulatedFiles.h"
#include "platform/simulated/SimulatedHTTP.h"
#include "platform/simulated/SimulatedLog.h"
#include "platform/simulated/SimulatedNotifications.h"
#include "platform/simulated/SimulatedPairedDeviceRegistry.h"
#include "platform/simulated/SimulatedProcesses.h"
#include "platform/simulated/SimulatedRandom.h"
#include "platform/simulated/SimulatedServiceListeners.h"
#include "platform/simulated/SimulatedStore.h"
#include "platform/simulated/SimulatedUserLocale.h"
#include "platform/simulated/SimulatedWorkQueues.h"

#include <cstdint>
#include <string>
#include <vector>

namespace kvr {

/// A whole world in memory: one thread, virtual time, everything decided by the seed and by what the test
/// sets in the public members.
///
///     SimulatedPlatform simulated;
///     simulated.http.respond(200, "{}");
///     Thing thing(simulated.platform);
///     thing.start();
///     simulated.queues.advance(3600);
///     EXPECT_TRUE(simulated.faults().empty());
struct SimulatedPlatform {
  static constexpr const char* kMainBundleIdentifier = "com.tarsil.kvragent";

  explicit SimulatedPlatform(std::uint64_t seed = 1, LogLevel leastLogged = LogLevel::Debug)
      : log(leastLogged), queues(clock, seed), random(seed) {}
  /// What waits finishes and all other work goes while everything it may use is still there.
  ~SimulatedPlatform() {
    log.beginEnding();
    activities.beginEnding();
    notifications.end();
    queues.end();
  }
  SimulatedPlatform(const SimulatedPlatform&) = delete;
  SimulatedPlatform& operator=(const SimulatedPlatform&) = delete;

  /// What no working program does: exceptions that left work items, waits that nothing could end, completions
  /// answered twice or never.
  std::vector<std::string> faults() const {
    std::vector<std::string> faults = queues.faults();
    for (auto& fault : log.faults()) faults.push_back(std::move(fault));
    return faults;
  }

  SimulatedLog log;
  SimulatedClock clock;
  SimulatedWorkQueues queues;
  SimulatedFiles files{clock};
  PropertyListFiles propertyLists{files, clock, log};
  FilePreferences preferences{propertyLists, log, kMainBundleIdentifier};
  SimulatedUserLocale locale;
  SimulatedRandom random;
  SimulatedHTTP http{queues, clock};
  SimulatedDeviceProperties deviceProperties;
  SimulatedFeatureFlags featureFlags;
  SimulatedPairedDeviceRegistry pairedDevices;
  SimulatedAccountStore accounts{queues};
  SimulatedAccountSession accountSession;
  SimulatedDeviceAttestation attestation{queues};
  SimulatedServiceListeners services{queues, log};
  SimulatedProcesses processes;
  SimulatedActivityScheduler activities{propertyLists,
                                        clock,
                                        queues,
                                        random,
                                        deviceProperties,
                                        log,
                                        kMainBundleIdentifier,
                                        {"com.tarsil.kvragent.upgrade", "com.tarsil.kvragent.boot"}};
  FileFollowUpCenter followUps{propertyLists, clock};
  SimulatedCarrierInfo carriers;
  SimulatedNotifications notifications{queues};
  SimulatedCleanExit cleanExit{clock};
  SimulatedApplicationRegistry applications;
  SimulatedStore store{queues};
  SimulatedStringTables stringTables;
  Platform platform{log,           clock,
                    queues,        files,
                    propertyLists, preferences,
                    locale,        random,
                    http,          deviceProperties,
                    featureFlags,  pairedDevices,
                    accounts,      accountSession,
                    attestation,   services,
                    processes,     activities,
                    followUps,     carriers,
                    notifications, cleanExit,
                    applications,  store,
                    stringTables,  kMainBundleIdentifier};
};

}  // namespace kvr
