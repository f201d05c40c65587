#pragma once

#include "platform/FileFollowUpCenter.h"
#include "platform/FilePreferences.h"
#include "platform/Platform.h"
#include "platform/local/DeviceRoot.h"
#include "platform/local/EventLoop.h"
#include "platform/local/LocalAccountSession.h"
#include "platform/local/LocalAccountStore.h"
#include "platform/local/LocalActivityScheduler.h"
#include "platform/local/LocalApplicationRegistry.h"
#include "platform/local/LocalCarrierInfo.h"
#include "platform/local/LocalChanges.h"
#include "platform/local/LocalCleanExit.h"
#include "platform/local/LocalClock.h"
#include "platform/local/LocalDeviceAttestation.h"
#include "platform/local/LocalDeviceProperties.h"
#include "platform/local/LocalEntitlements.h"
#include "platform/local/LocalFeatureFlags.h"
#include "platform/local/LocalFiles.h"
#include "platform/local/LocalHTTP.h"
#include "platform/local/LocalLog.h"
#include "platform/local/LocalNotifications.h"
#include "platform/local/LocalPairedDeviceRegistry.h"
#include "platform/local/LocalProcesses.h"
#include "platform/local/LocalRandom.h"
#include "platform/local/LocalServiceListeners.h"
#include "platform/local/LocalStore.h"
#include "platform/local/LocalStringTables.h"
#include "platform/local/LocalUserLocale.h"
#include "platform/local/LocalWorkQueues.h"

#include <functional>
#include <memory>

namespace kvr {

/// The platform on this machine, as the environment describes it.
///
/// Built on the main thread, before the main loop runs. At the end, after the loop: `end`, then destroy.
struct LocalPlatform {
  /// `busLost` is called on the bus thread, see `LocalServiceListeners`.
  LocalPlatform(EventLoop& mainLoop, std::unique_ptr<LocalLog> log, std::function<void()> busLost);

  /// From here on nothing new is begun of the agent's own accord. To be called before the loop is left, which
  /// lets go of what was delayed.
  void beginEnding();
  /// Fails what waits for remote answers, lets running work finish and send its replies. False when some work
  /// did not finish within `limit` seconds; nothing must be destroyed then.
  bool end(double limit);

  // In this order: what stands further down uses what stands above.
  const std::unique_ptr<LocalLog> log;
  LocalClock clock;
  LocalRandom random;
  LocalFiles files{*log};
  PropertyListFiles propertyLists{files, clock, *log};
  FilePreferences preferences{propertyLists, *log, kMainBundleIdentifier};
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
  FileFollowUpCenter followUps{propertyLists, clock};
  LocalCarrierInfo carriers{root};
  LocalNotifications notifications{services.connection(), queues, *log};
  LocalChanges changes;
  LocalCleanExit cleanExit;
  LocalApplicationRegistry applications{root};
  LocalStore store{root, *log};
  LocalStringTables stringTables{root, locale};
  Platform platform{*log,          clock,
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

  static constexpr const char* kMainBundleIdentifier = "com.tarsil.kvragent";
};

}  // namespace kvr
