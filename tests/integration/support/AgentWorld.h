#pragma once

#include "Prelude.h"
#include "integration/support/PrivateBus.h"
#include "integration/support/RawBusClient.h"

namespace kvr::testing {

/// A phone with two watches, its coverage service and its agent: the real programs on a bus of their own. The
/// test is the client.
///
/// The agent is started by `startAgent`, so that a test may change the device before. It finds a device that
/// it has set up earlier, and so does nothing of its own accord.
class AgentWorld {
 public:
  static constexpr const char* kPhone = "SNPHONE00001";
  static constexpr const char* kFirstWatch = "SNWATCH00001";
  static constexpr const char* kSecondWatch = "SNWATCH00002";
  enum Policy : std::uint64_t { Default = 0, CacheOnly = 1, Refresh = 2 };

  /// Whether the service insists on attested requests about the phone.
  enum class Attestation { Required, Optional };

  explicit AgentWorld(Attestation attestation = Attestation::Required);

  /// From here on it is the device's first start.
  void becomeNewDevice() const {
    std::filesystem::remove(home() / kActivities);
    changePreference("PostUpgradeActivityCompleted", {});
  }
  /// Starts the agent, after killing one that runs, and returns once it has its name on the bus.
  void startAgent();
  /// Instead: has the bus start it at the first call. It prints to the bus's error output, and its exit
  /// status in the end.
  void letTheBusStartIt();
  /// Waits until somebody on the bus has the agent's name, or nobody has.
  void waitForName(bool isOwned) const;
  ChildProcess& agent() { return *agent_; }
  RawBusClient newClient() const { return RawBusClient(bus.address()); }

  /// A new file in the old one's place: nobody reads half of it.
  void writeDeviceFile(const std::string& name, const Value& tree,
                       PropertyListEncoding encoding = PropertyListEncoding::XML) const {
    const auto path = directory.write("device/new", *writePropertyList(tree, encoding));
    const auto place = directory / "device" / name;
    std::filesystem::create_directories(place.parent_path());
    std::filesystem::rename(path, place);
  }
  void entitle(const Value& value) const;
  void setLocale(const std::string& identifier) const {
    writeDeviceFile("Locale.plist", Dictionary{{"identifier", identifier}});
  }
  void pair(const std::vector<std::string>& serialNumbers) const;
  /// The account of the device, with a script for renewals (null: none).
  void setAccount(const Value& renewal) const;
  /// What the service answers about a device (SERIAL), or about it in one locale (SERIAL.LOCALE).
  void setCoverage(const std::string& name, const std::string& json) const {
    directory.write("service/coverage/" + name + ".json", json);
  }
  /// Tells the service how to answer coverage requests, in the rules that its control endpoint takes.
  void misbehave(const std::string& rules) const;

  /// The requests that the service got, as it recorded them.
  std::vector<Value> requests() const;
  /// Those for coverage.
  std::vector<Value> coverageRequests() const;
  /// A property list below the home directory.
  Value file(const std::string& path) const { return *readPropertyList(*contentOfFile(home() / path)); }
  void setPreferences(const Value& preferences) const {
    writeFile(home() / kPreferences, *writePropertyList(preferences, PropertyListEncoding::Binary));
  }
  Value preferences() const { return file(kPreferences); }
  void changePreference(const std::string& key, const Value& value) const {
    Dictionary changed = preferences().dictionary();
    changed.erase(key);
    if (!value.isNull()) changed.emplace(key, value);
    setPreferences(changed);
  }
  std::string cacheFileOf(const std::string& serialNumber) const;
  std::filesystem::path home() const { return directory / "home"; }

  // Calls by a client, and what they reply.
  static Value info(const RawBusClient& client, const std::string& serialNumber, std::uint64_t policy) {
    return client.value("a{sv}", client.call("GetDeviceInfoForSerialNumber", "st", {serialNumber, policy}));
  }
  static Array allInfos(const RawBusClient& client, std::uint64_t policy) {
    return client.value("aa{sv}", client.call("GetAllDeviceInfosUsingPolicy", "tb", {policy, false})).array();
  }
  /// The warranty's dictionary in a device info, null for none.
  static Value warrantyIn(const Value& info) { return info["warranty"]["DictionaryRepresentation"]; }

  PrivateBus bus;
  TemporaryDirectory directory;
  ChildProcess::Environment moreEnvironment;  ///< of the agent, besides what makes its world

 private:
  static constexpr const char* kActivities = "Library/Activities/com.tarsil.kvragent.plist";
  static constexpr const char* kPreferences = "Library/Preferences/com.tarsil.kvragent.plist";

  ChildProcess::Environment environment() const;
  std::unique_ptr<ChildProcess> service_;
  std::string serviceURL_;
  std::unique_ptr<ChildProcess> agent_;
};

using World = AgentWorld;

}  // namespace kvr::testing
