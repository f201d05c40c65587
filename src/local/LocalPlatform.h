#pragma once

#include "local/bus/LocalNotifications.h"
#include "local/bus/LocalServiceListeners.h"
#include "local/device/DeviceRoot.h"
#include "local/device/LocalAccountSession.h"
#include "local/device/LocalAccountStore.h"
#include "local/device/LocalApplicationRegistry.h"
#include "local/device/LocalCarrierInfo.h"
#include "local/device/LocalDeviceProperties.h"
#include "local/device/LocalEntitlements.h"
#include "local/device/LocalFeatureFlags.h"
#include "local/device/LocalPairedDeviceRegistry.h"
#include "local/device/LocalStore.h"
#include "local/http/LocalHTTP.h"
#include "local/keys/LocalDeviceAttestation.h"
#include "local/locale/LocalStringTables.h"
#include "local/locale/LocalUserLocale.h"
#include "local/loop/EventLoop.h"
#include "local/loop/LocalWorkQueues.h"
#include "local/process/LocalActivityScheduler.h"
#include "local/process/LocalChanges.h"
#include "local/process/LocalCleanExit.h"
#include "local/process/LocalProcesses.h"
#include "local/system/LocalClock.h"
#include "local/system/LocalFiles.h"
#include "local/system/LocalLog.h"
#include "local/system/LocalRandom.h"
#include "platform/Platform.h"
#include "platform/names/Names.h"
#include "platform/stores/FileFollowUpCenter.h"
#include "platform/stores/FilePreferences.h"

#include <functional>
#include <memory>

namespace kvr {

/// The platform on this machine, configured by the environment.
///
/// Build it on the main thread before the main loop runs. After the loop: call `end`, then destroy.
struct LocalPlatform {
  /// `busLost` is called on the bus thread; see `LocalServiceListeners`.
  LocalPlatform(EventLoop& mainLoop, std::unique_ptr<LocalLog> log, std::function<void()> busLost);

  /// From here on the agent starts nothing new on its own. Call it before leaving the loop, which
  /// drops delayed work.
  void beginEnding();
  /// Fails open requests, waits until running work has finished and sends the replies. False when some work
  /// did not finish within `limit` seconds; then destroy nothing.
  bool end(double limit);

  // The order matters: a member uses only those above it.
  const std::unique_ptr<LocalLog> log;
  LocalClock clock;
  LocalRandom random;
  LocalFiles files{*log};
  PropertyListFiles propertyLists{files, clock, *log};
  FilePreferences preferences{propertyLists, *log, names::kAgent};
  DeviceRoot root{propertyLists, *log};
  LocalUserLocale locale{root, *log};
  LocalDeviceProperties deviceProperties{root};
  LocalFeatureFlags featureFlags{root};
  LocalPairedDeviceRegistry pairedDevices{root};
  LocalEntitlements entitlements{root};
  LocalProcesses processes{propertyLists};
  LocalWorkQueues queues;
  LocalAccountStore accounts{root, *log};
  LocalAccountSession accountSession{root};
  LocalDeviceAttestation attestation{root, deviceProperties, files, clock, *log};
  LocalHTTP http{queues, *log};
  LocalServiceListeners services;
  LocalActivityScheduler activities;
  FileFollowUpCenter followUps{propertyLists, clock, services.observers()};
  LocalCarrierInfo carriers{root};
  LocalNotifications notifications{services.connection(), queues, *log};
  LocalChanges changes;
  LocalCleanExit cleanExit;
  LocalApplicationRegistry applications{root};
  LocalStore store{root, *log};
  LocalStringTables stringTables{root, locale};
  Platform platform{
      .log = *log,
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
      .observers = services.observers(),
      .cleanExit = cleanExit,
      .applications = applications,
      .store = store,
      .stringTables = stringTables,
      .mainBundleIdentifier = names::kAgent,
  };
};

}  // namespace kvr
