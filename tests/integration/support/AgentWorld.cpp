#include "integration/support/AgentWorld.h"

#include "integration/support/Host.h"
#include "platform/codec/JSON.h"
#include "platform/text/SHA256Hash.h"

#include <httplib.h>

#include <stdexcept>

namespace kvr::testing {

AgentWorld::AgentWorld(Attestation attestation, Transport transport) : transport_(transport) {
  directory.write("service/kvrV2.plist", "{ LowServerVersion = 2; HighServerVersion = 3; }");
  setCoverage("default", R"({"covered":true,"coverageLocalizedLabel":"Warranty"})");
  for (const auto* serialNumber : {kPhone, kFirstWatch, kSecondWatch}) {
    setCoverage(std::string(serialNumber) + ".fr_FR",
                R"({"covered":true,"coverageLocalizedLabel":"Garantie"})");
  }
  writeDeviceFile("DeviceProperties.plist", Dictionary{{"SerialNumber", kPhone},
                                                       {"UserAssignedDeviceName", "Phone"},
                                                       {"ProductType", "Phone1,2"},
                                                       {"ProductVersion", "17.9"}});
  writeDeviceFile("FeatureFlags.plist", Dictionary{{"Kavrel", Dictionary{{"Bravik_3_0", true}}}});
  pair({kFirstWatch, kSecondWatch});
  setAccount({});
  setLocale("en_US");
  entitle(true);

  std::vector<std::string> command{KVR_PROGRAMS "/kvr-coverage-service", "--root", directory / "service",
                                   "--tls", directory / "authorities.pem"};
  if (attestation == Attestation::Required) {
    command.insert(command.end(),
                   {"--authority",
                    (home() / "Library/Keys/com.tarsil.kvragent.kestCertificates/authority.pem").string()});
  }
  service_ = std::make_unique<ChildProcess>(command);
  constexpr std::string_view kListening = "listening on ";
  controlURL_ = service_->waitForOutput(kListening).substr(kListening.size());
  directory.write(std::string("home/") + kActivities, "{ OSVersion = \"17.9\"; activities = {}; }");
  setServiceURL((transport == Transport::TLS ? "https://127.0.0.1:" : "http://127.0.0.1:") + port());
}

void AgentWorld::setServiceURL(const std::string& url) const {
  setPreferences(Dictionary{{"PostUpgradeActivityCompleted", true},
                            {"ServerVersionURL", url + "/library/TARSIL/asset/kvrV2.plist"},
                            {"WarrantyURL", url + "/api/v3/coverage/summary"},
                            {"WearablesWarrantyURL", url + "/api/v2/coverage/summary"}});
}

ChildProcess::Environment AgentWorld::environment() const {
  ChildProcess::Environment environment{
      {"HOME", home().string()}, {"KVR_DEVICE_ROOT", (directory / "device").string()},
      {"KVR_LOG_PRIVATE", "1"},  {"DBUS_SESSION_BUS_ADDRESS", bus.address()},
      {"LC_ALL", "C"},           {"JOURNAL_STREAM", ""}};
  environment.insert(moreEnvironment.begin(), moreEnvironment.end());
  if (transport_ == Transport::TLS) {
    environment[kTrustedAuthorities] = directory / "authorities.pem";
    environment["LD_PRELOAD"] += ":" KVR_PROGRAMS "/libkvr-test-host.so";
  }
  return environment;
}

void AgentWorld::startAgent() {
  for (const auto* path : {"Library", "Library/Preferences", "Library/Activities"}) {
    std::filesystem::permissions(home() / path, std::filesystem::perms::owner_all);
  }
  std::vector<std::string> command{KVR_PROGRAMS "/kvragent"};
  if (!prologue.empty()) command = {"/bin/sh", "-e", "-c", prologue + "\nexec " + command.front()};
  if (mayMount) command.insert(command.begin(), {"unshare", "--mount"});
  agent_ = std::make_unique<ChildProcess>(command, environment());
  waitForName(true);
}

void AgentWorld::letTheBusStartIt() {
  std::string script = "#!/bin/sh\n";
  for (const auto& [name, value] : environment()) script += "export " + name + "='" + value + "'\n";
  script += KVR_PROGRAMS "/kvragent\necho \"agent: status $?\" >&2\n";
  bus.addService(RawBusClient::kName, "/bin/sh " + directory.write("start-agent", script).string());
}

void AgentWorld::waitForName(bool isOwned) const {
  if (newClient().waitForName(isOwned)) return;
  throw std::runtime_error("nothing happened to the agent's name: " + (agent_ ? agent_->errorOutput() : ""));
}

void AgentWorld::entitle(const Value& value) const {
  Dictionary granted;
  if (!value.isNull()) granted.emplace("com.tarsil.private.kvragent", value);
  writeDeviceFile("Entitlements.plist",
                  Dictionary{{std::filesystem::read_symlink("/proc/self/exe").string(), granted}});
}

void AgentWorld::pair(const std::vector<std::string>& serialNumbers) const {
  Array watches;
  for (const auto& serialNumber : serialNumbers) {
    watches.push_back(Dictionary{{"name", "Watch " + serialNumber},
                                 {"serialNumber", serialNumber},
                                 {"pairedDate", Date{1'750'000'000}},
                                 {"isPaired", true}});
  }
  // A serial number may hold what no XML can.
  writeDeviceFile("PairedDevices.plist", watches, PropertyListEncoding::Binary);
}

void AgentWorld::setAccount(const Value& renewal) const {
  Dictionary authentication{{"alternateDSID", "alternate"},
                            {"tokens", Dictionary{{"com.tarsil.vornic.supportapp.auth", "first-token"}}}};
  if (!renewal.isNull()) authentication.emplace("renewal", renewal);
  writeDeviceFile(
      "Accounts.plist",
      Dictionary{{"primaryAccount", Dictionary{{"altDSID", "alt"},
                                               {"storefront", "143441"},
                                               {"authenticationAccount", authentication}}},
                 {"sessionHeaders", Dictionary{{"clientInfo", Dictionary{{"X-Client", "c"}}},
                                               {"deviceIdentifier", Dictionary{{"X-Device", "d"}}},
                                               {"authentication", Dictionary{{"X-Proof", "p"}}}}}});
}

void AgentWorld::misbehave(const std::string& rules, const std::string& endpoint) const {
  httplib::Client client(controlURL_);
  const auto answer = client.Post("/control", "{\"" + endpoint + "\":" + rules + "}", "application/json");
  if (!answer || answer->status != 200) throw std::runtime_error("the service does not take " + rules);
}

Value AgentWorld::counts() const {
  const auto answer = httplib::Client(controlURL_).Get("/control/requests");
  if (!answer) throw std::runtime_error("the service does not say what it has counted");
  return *readJSON(answer->body);
}

std::vector<Value> AgentWorld::requests() const {
  std::set<std::filesystem::path> paths;
  for (const auto& entry : std::filesystem::directory_iterator(directory / "service/requests")) {
    if (entry.path().extension() == ".json") paths.insert(entry.path());
  }
  std::vector<Value> requests;
  for (const auto& path : paths) requests.push_back(*readJSON(*contentOfFile(path)));
  return requests;
}

std::vector<Value> AgentWorld::coverageRequests() const {
  auto all = requests();
  std::erase_if(all, [](const Value& request) { return request["method"] != Value("POST"); });
  return all;
}

std::string AgentWorld::cacheFileOf(const std::string& serialNumber) const {
  return (home() / "Library/Application Support/com.tarsil.Kavrel" /
          (sha256Hash(serialNumber) + "_Warranty.plist"))
      .string();
}

}  // namespace kvr::testing
