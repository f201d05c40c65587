#pragma once

#include "platform/Platform.h"
#include "platform/names/Names.h"
#include "platform/stores/FileFollowUpCenter.h"
#include "platform/stores/FilePreferences.h"
#include "simulated/SimulatedAccountStore.h"
#include "simulated/SimulatedActivityScheduler.h"
#include "simulated/SimulatedCarrierInfo.h"
#include "simulated/SimulatedCleanExit.h"
#include "simulated/SimulatedDeviceAttestation.h"
#include "simulated/SimulatedDeviceProperties.h"
#include "simulated/SimulatedFeatureFlags.h"
#include "simulated/SimulatedFiles.h"
#include "simulated/SimulatedHTTP.h"
#include "simulated/SimulatedLog.h"
#include "simulated/SimulatedNotifications.h"
#include "simulated/SimulatedObservers.h"
#include "simulated/SimulatedPairedDeviceRegistry.h"
#include "simulated/SimulatedProcesses.h"
#include "simulated/SimulatedServiceListeners.h"
#include "simulated/SimulatedStore.h"
#include "simulated/SimulatedUserLocale.h"
#include "simulated/loop/SimulatedClock.h"
#include "simulated/loop/SimulatedRandom.h"
#include "simulated/loop/SimulatedWorkQueues.h"

#include <cstdint>
#include <string>
#include <vector>

namespace kvr {

/// A whole platform in memory: one thread and virtual time. Everything is decided by the seed and by what the
/// test sets in the public members.
///
///     SimulatedPlatform simulated;
///     simulated.http.respond(200, "{}");
///     Thing thing(simulated.platform);
///     thing.start();
///     simulated.queues.advance(3600);
///     EXPECT_TRUE(simulated.faults().empty());
struct SimulatedPlatform {
  explicit SimulatedPlatform(std::uint64_t seed = 1, LogLevel leastLogged = LogLevel::Debug)
      : log(leastLogged), queues(clock, seed), random(seed) {}
  /// Lets waiting items finish and drops all other work while everything it may use still exists.
  ~SimulatedPlatform() {
    log.beginEnding();
    activities.beginEnding();
    notifications.end();
    queues.end();
  }
  SimulatedPlatform(const SimulatedPlatform&) = delete;
  SimulatedPlatform& operator=(const SimulatedPlatform&) = delete;

  /// What a correct program never does: exceptions that leave work items, waits that nothing can end,
  /// completions answered twice or never.
  std::vector<std::string> faults() const {
    std::vector<std::string> faults = queues.faults();
    for (auto& fault : log.faults()) faults.push_back(std::move(fault));
    return faults;
  }

  SimulatedLog log;
  SimulatedClock clock;
  SimulatedWorkQueues queues;
  SimulatedFiles files{clock, &queues};
  PropertyListFiles propertyLists{files, clock, log};
  FilePreferences preferences{propertyLists, log, names::kAgent};
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
  SimulatedActivityScheduler activities{
      propertyLists,    clock, queues,        random,
      deviceProperties, log,   names::kAgent, {names::kPostUpgrade, names::kPostBoot}};
  SimulatedObservers observers;
  FileFollowUpCenter followUps{propertyLists, clock, observers};
  SimulatedCarrierInfo carriers;
  SimulatedNotifications notifications{queues};
  SimulatedCleanExit cleanExit{clock};
  SimulatedApplicationRegistry applications;
  SimulatedStore store{queues};
  SimulatedStringTables stringTables;
  Platform platform{
      .log = log,
      .clock = clock,
      .queues = queues,
      .files = files,
      .propertyLists = propertyLists,
      .preferences = preferences,
      .locale = locale,
      .random = random,
      .http = http,
      .deviceProperties = deviceProperties,
      .featureFlags = featureFlags,
      .pairedDevices = pairedDevices,
      .accounts = accounts,
      .accountSession = accountSession,
      .attestation = attestation,
      .services = services,
      .processes = processes,
      .activities = activities,
      .followUps = followUps,
      .carriers = carriers,
      .notifications = notifications,
      .observers = observers,
      .cleanExit = cleanExit,
      .applications = applications,
      .store = store,
      .stringTables = stringTables,
      .mainBundleIdentifier = names::kAgent,
  };
};

}  // namespace kvr
