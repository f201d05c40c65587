#pragma once

#include "platform/log/Log.h"
#include "platform/services/AccountStore.h"
#include "platform/services/ActivityScheduler.h"
#include "platform/services/ApplicationRegistry.h"
#include "platform/services/CarrierInfo.h"
#include "platform/services/CleanExit.h"
#include "platform/services/Clock.h"
#include "platform/services/DeviceAttestation.h"
#include "platform/services/DeviceProperties.h"
#include "platform/services/FeatureFlags.h"
#include "platform/services/FollowUpCenter.h"
#include "platform/services/HTTP.h"
#include "platform/services/Notifications.h"
#include "platform/services/Observers.h"
#include "platform/services/PairedDeviceRegistry.h"
#include "platform/services/Preferences.h"
#include "platform/services/Processes.h"
#include "platform/services/Random.h"
#include "platform/services/ServiceListener.h"
#include "platform/services/SharedObjects.h"
#include "platform/services/StoreLookup.h"
#include "platform/services/StringTables.h"
#include "platform/services/UserLocale.h"
#include "platform/services/WorkQueues.h"
#include "platform/stores/PropertyListFiles.h"

#include <string>

namespace kvr {

/// Everything outside the agent that it uses, one reference per interface.
///
/// Code that needs any of it takes `Platform&` as its first parameter and may keep the reference; the
/// platform outlives the agent. Several platforms can exist in one process.
struct Platform {
  Log& log;
  Clock& clock;
  WorkQueues& queues;
  Files& files;
  PropertyListFiles& propertyLists;
  Preferences& preferences;
  UserLocale& locale;
  Random& random;
  HTTP& http;
  DeviceProperties& deviceProperties;
  FeatureFlags& featureFlags;
  PairedDeviceRegistry& pairedDevices;
  AccountStore& accounts;
  AccountSession& accountSession;
  DeviceAttestation& attestation;
  ServiceListeners& services;
  Processes& processes;
  ActivityScheduler& activities;
  FollowUpCenter& followUps;
  CarrierInfo& carriers;
  Notifications& notifications;
  Observers& observers;
  CleanExit& cleanExit;
  ApplicationRegistry& applications;
  StoreLookup& store;
  StringTables& stringTables;
  std::string mainBundleIdentifier;
  SharedObjects sharedObjects{};
};

}  // namespace kvr
