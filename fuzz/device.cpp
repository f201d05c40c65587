// The files that describe the device: the input replaces each in turn, and every value is asked for.
#include "Fuzz.h"
#include "integration/support/TemporaryDirectory.h"
#include "local/device/LocalAccountSession.h"
#include "local/device/LocalAccountStore.h"
#include "local/device/LocalApplicationRegistry.h"
#include "local/device/LocalCarrierInfo.h"
#include "local/device/LocalDeviceProperties.h"
#include "local/device/LocalEntitlements.h"
#include "local/device/LocalFeatureFlags.h"
#include "local/device/LocalNetwork.h"
#include "local/device/LocalPairedDeviceRegistry.h"
#include "local/device/LocalStore.h"
#include "local/keys/LocalDeviceAttestation.h"
#include "local/locale/LocalStringTables.h"
#include "local/locale/LocalUserLocale.h"
#include "local/process/LocalProcesses.h"
#include "simulated/SimulatedFiles.h"
#include "simulated/SimulatedLog.h"
#include "simulated/loop/SimulatedClock.h"

#include <atomic>
#include <cstdlib>

namespace kvr::fuzz {
namespace {

/// Ownership is checked on real files, so there are real, empty ones; their contents are simulated.
struct Device {
  Device() {
    for (const auto* trusted : {"Accounts.plist", "Entitlements.plist"}) directory.write(trusted, "");
  }

  testing::TemporaryDirectory directory;
  SimulatedClock clock;
  SimulatedLog log;
  SimulatedFiles files{clock};
  PropertyListFiles lists{files, clock, log};
  DeviceRoot root{lists, log, directory.path().string()};
  LocalUserLocale locale{root, log};
  LocalDeviceProperties properties{root, "/nowhere"};
  LocalFeatureFlags flags{root};
  LocalPairedDeviceRegistry paired{root};
  LocalEntitlements entitlements{root};
  LocalAccountSession session{root};
  LocalApplicationRegistry applications{root};
  LocalCarrierInfo carriers{root};
  LocalDeviceAttestation attestation{root, properties, files, clock, log};
  LocalStringTables tables{root, locale, "/nowhere"};
  LocalProcesses processes{lists};

  void ask();
  void askAccounts();
};

void Device::ask() {
  for (const auto question :
       {DeviceProperties::kSerialNumber, DeviceProperties::kProductType, DeviceProperties::kProductVersion}) {
    static_cast<void>(properties.answer(question));
  }
  static_cast<void>(properties.isInternalInstall());
  static_cast<void>(flags.isEnabled("Kavrel", "Bravik_3_0"));
  static_cast<void>(paired.allDevicesPassing([](const PairedDeviceEntry&) { return true; }));
  static_cast<void>(carriers.subscriptions());
  static_cast<void>(applications.installedApplication("com.tarsil.supportapp"));
  static_cast<void>(attestation.isSupported());
  static_cast<void>(entitlements.valueFor({1, 2}, "com.tarsil.private.kvragent"));
  static_cast<void>(LocalNetwork::isReachable(root.dictionary("Network.plist"), "/nowhere"));
  static_cast<void>(processes.bundleAt(directory.path().string()));
  const auto language = locale.preferredIdentifier();
  require(!language.empty() && language.find('/') == std::string::npos, "a locale can be part of a path");
  static_cast<void>(tables.localizedString("KavrelUI", "Localizable", "KEY", "default"));
}

void Device::askAccounts() {
  std::atomic<int> replies = 0;
  int questions = 2;
  {
    LocalStore store(root, log);
    store.purchaseHistory(1, {"com.tarsil.supportapp"}, [&replies](const auto&) { ++replies; });
    store.lookUp({"com.tarsil.supportapp"}, "com.tarsil.Preferences",
                 [&replies](const auto&, const auto&) { ++replies; });
    LocalAccountStore accounts(root, log);
    HTTPRequest request;
    session.addClientInfoHeader(request);
    session.addDeviceIdentifierHeader(request);
    static_cast<void>(session.authenticationHeadersFor(request));
    if (const auto account = accounts.primaryAccount()) {
      static_cast<void>(accounts.storeAccountFor(*account));
      if (const auto authentication = accounts.authenticationAccountFor(*account)) {
        static_cast<void>(accounts.tokenFor(*authentication, "com.tarsil.vornic.supportapp.auth"));
        ++questions;
        accounts.renewCredentialsFor(*authentication, {}, [&replies](auto, const auto&) { ++replies; });
      }
    }
  }
  require(replies == questions, "every question has one answer");
}

}  // namespace

void run(std::string_view input) {
  static Device device;
  const std::vector<std::string> dictionaries = {"Accounts.plist",
                                                 "Applications.plist",
                                                 "Attestation.plist",
                                                 "DeviceProperties.plist",
                                                 "Entitlements.plist",
                                                 "FeatureFlags.plist",
                                                 "Info.plist",
                                                 "Locale.plist",
                                                 "Network.plist",
                                                 "Store.plist",
                                                 "Resources/KavrelUI/en/Localizable.plist"};
  const std::vector<std::string> arrays = {"Carriers.plist", "PairedDevices.plist"};
  for (const auto* names : {&dictionaries, &arrays}) {
    for (const auto& name : *names) device.files.put(device.root.pathOf(name), std::string(input));
  }
  const auto tree = readPropertyList(input);
  const std::size_t damaged = (tree && tree->isDictionary() ? 0 : dictionaries.size()) +
                              (tree && tree->isArray() ? 0 : arrays.size());
  device.log.clear();
  ::setenv("LC_ALL", "en_US", 1);
  device.ask();
  device.askAccounts();
  require(device.log.texts(LogLevel::Error).size() == damaged, "one line a damaged file");
  device.ask();
  require(device.log.texts(LogLevel::Error).size() == damaged, "which is not repeated");
}

}  // namespace kvr::fuzz
