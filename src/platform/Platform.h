#pragma once

#include "platform/AccountStore.h"
#include "platform/ActivityScheduler.h"
#include "platform/ApplicationRegistry.h"
#include "platform/CarrierInfo.h"
#include "platform/CleanExit.h"
#include "platform/Clock.h"
#include "platform/DeviceAttestation.h"
#include "platform/DeviceProperties.h"
#include "platform/FeatureFlags.h"
#include "platform/FollowUpCenter.h"
#include "platform/HTTP.h"
#include "platform/Log.h"
#include "platform/Notifications.h"
#include "platform/PairedDeviceRegistry.h"
#include "platform/Preferences.h"
#include "platform/Processes.h"
#include "platform/PropertyListFiles.h"
#include "platform/Random.h"
#include "platform/ServiceListener.h"
#include "platform/SharedObjects.h"
#include "platform/StoreLookup.h"
#include "platform/StringTables.h"
#include "platform/UserLocale.h"
#include "platform/WorkQueues.h"

#include <string>

namespace kvr {

/// Everything the agent may know of the world, one reference an interface.
///
/// Whatever needs the world takes `Platform&` first and keeps the reference; the platform outlives the agent.
/// Two platforms can live in one process.
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
  CleanExit& cleanExit;
  ApplicationRegistry& applications;
  StoreLookup& store;
  StringTables& stringTables;
  std::string mainBundleIdentifier;
  SharedObjects sharedObjects{};
};

}  // namespace kvr
