#pragma once

#include "Prelude.h"
#include "integration/support/PrivateBus.h"
#include "integration/support/RawBusClient.h"

namespace kvr::testing {

/// A phone with two watches, its coverage service and its agent: the real programs on a private bus. The test
/// is the client.
///
/// `startAgent` starts the agent, so that a test may change the device first. By default the device is
/// already set up, so that the agent does nothing on its own.
class AgentWorld {
 public:
  static constexpr const char* kPhone = "SNPHONE00001";
  static constexpr const char* kFirstWatch = "SNWATCH00001";
  static constexpr const char* kSecondWatch = "SNWATCH00002";
  static constexpr const char* kActivities = "Library/Activities/com.tarsil.kvragent.plist";
  enum Policy : std::uint64_t { Default = 0, CacheOnly = 1, Refresh = 2 };

  /// Whether the service requires attestation for requests about the phone.
  enum class Attestation { Required, Optional };

  /// How the agent reaches the service. Under a sanitizer, no library can be preloaded that has the agent
  /// trust the service's certificate.
  enum class Transport { Plain, TLS };
  static constexpr Transport kUsual = KVR_SANITIZED ? Transport::Plain : Transport::TLS;

  explicit AgentWorld(Attestation attestation = Attestation::Required, Transport transport = kUsual);

  /// Makes the next start the device's first one.
  void becomeNewDevice() const {
    std::filesystem::remove(home() / kActivities);
    changePreference("PostUpgradeActivityCompleted", {});
  }
  /// Kills the agent if it runs, starts it, and returns once it owns its name on the bus.
  void startAgent();
  /// Lets the bus start the agent at the first call instead. The agent's output, and finally its exit status,
  /// go to the bus's error output.
  void letTheBusStartIt();
  /// Waits until the agent's name on the bus has an owner, or has none.
  void waitForName(bool isOwned) const;
  ChildProcess& agent() { return *agent_; }
  RawBusClient newClient() const { return RawBusClient(bus.address()); }

  /// Replaces the file atomically, so that nobody reads half of it.
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
  /// Sets the device's account, with a script for renewals (null: none).
  void setAccount(const Value& renewal) const;
  /// Sets the service's answer about a device (SERIAL), or in one locale (SERIAL.LOCALE).
  void setCoverage(const std::string& name, const std::string& json) const {
    directory.write("service/coverage/" + name + ".json", json);
  }
  /// Sets the rules of an endpoint; see the service's control endpoint.
  void misbehave(const std::string& rules, const std::string& endpoint = "coverage") const;
  /// Sets where the agent finds the service: scheme, host and port. Keeps no other preference.
  void setServiceURL(const std::string& url) const;
  /// The service's port on 127.0.0.1.
  std::string port() const { return controlURL_.substr(controlURL_.rfind(':') + 1); }

  /// What the service has counted.
  Value counts() const;
  /// The requests that the service has recorded.
  std::vector<Value> requests() const;
  /// Only the coverage requests.
  std::vector<Value> coverageRequests() const;
  /// Reads a property list below the home directory.
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
  /// The agent's changes to the environment of this process.
  ChildProcess::Environment environment() const;

  // Calls of a client; they return the reply.
  static Value info(const RawBusClient& client, const std::string& serialNumber, std::uint64_t policy) {
    return client.value("a{sv}", client.call("GetDeviceInfoForSerialNumber", "st", {serialNumber, policy}));
  }
  static Array allInfos(const RawBusClient& client, std::uint64_t policy) {
    return client.value("aa{sv}", client.call("GetAllDeviceInfosUsingPolicy", "tb", {policy, false})).array();
  }
  /// The warranty's dictionary in a device info; null if there is none.
  static Value warrantyIn(const Value& info) { return info["warranty"]["DictionaryRepresentation"]; }

  PrivateBus bus;
  TemporaryDirectory directory;
  ChildProcess::Environment moreEnvironment;  ///< for the agent, in addition to the usual one
  /// Shell commands that the agent's process executes before it becomes the agent.
  std::string prologue;
  /// Whether the prologue may mount, which nobody else sees. Takes root.
  bool mayMount = false;

 private:
  static constexpr const char* kPreferences = "Library/Preferences/com.tarsil.kvragent.plist";

  std::unique_ptr<ChildProcess> service_;
  const Transport transport_;
  std::string controlURL_;
  std::unique_ptr<ChildProcess> agent_;
};

using World = AgentWorld;

}  // namespace kvr::testing
