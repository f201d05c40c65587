#include "client/kvrctl/Doctor.h"

#include "client/AgentClient.h"
#include "client/LocalState.h"
#include "client/kvrctl/Output.h"
#include "local/device/DeviceRoot.h"
#include "platform/codec/PropertyList.h"
#include "platform/names/Names.h"
#include "platform/text/URL.h"

#include <fcntl.h>
#include <netdb.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <system_error>
#include <utility>

namespace kvr::client {
namespace {

namespace fs = std::filesystem;

constexpr int kAnswerLimit = 5;                // seconds
constexpr int kConnectLimit = 3000;            // milliseconds
constexpr std::time_t kYear2024 = 1704067200;  // the clock is wrong if it shows an earlier time
constexpr std::time_t kYear2100 = 4102444800;

std::string reasonOf(int error) { return std::generic_category().message(error); }

fs::path deviceRoot() { return DeviceRoot::directoryFromEnvironment(); }

Verdict agentVerdict() {
  auto connected = AgentClient::connect();
  if (!connected) {
    return {"session bus", Verdict::Broken, connected.error().message, cureFor(connected.error())};
  }
  AgentClient agent = *std::move(connected);
  agent.setPatience(kAnswerLimit);
  const auto device = agent.defaultDevice();
  if (device) return {"agent", Verdict::Fine, "answers, and serves this program", ""};
  const bool isRefused = device.error().code == Refused;
  return {isRefused ? "entitlement" : "agent", Verdict::Broken, device.error().message,
          cureFor(device.error())};
}

/// Checks that nobody but root and this user can write a file that the agent has to trust.
Verdict trustVerdict(const fs::path& path) {
  const std::string subject = path.filename().string();
  struct stat status {};
  if (::stat(path.c_str(), &status) < 0) {
    const bool isMissing = errno == ENOENT;
    return {subject, isMissing ? Verdict::Doubtful : Verdict::Broken,
            isMissing ? path.string() + " does not exist" : reasonOf(errno),
            isMissing ? "describe the device there, or set KVR_DEVICE_ROOT" : "make it readable"};
  }
  const bool isOwned = status.st_uid == 0 || status.st_uid == ::getuid();
  const bool isPrivate = (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
  if (isOwned && isPrivate) return {subject, Verdict::Fine, "can be trusted", ""};
  return {subject, Verdict::Broken, "can be written by others, and is ignored",
          "chown it to root or yourself, and chmod go-w " + path.string()};
}

Verdict listVerdict(const std::string& subject, const fs::path& path) {
  std::ifstream file(path, std::ios::binary);
  std::error_code unknown;
  if (!file && !fs::exists(path, unknown)) return {subject, Verdict::Fine, "none yet", ""};
  const std::string bytes{std::istreambuf_iterator<char>(file), {}};
  if (!file.good() && bytes.empty())
    return {subject, Verdict::Broken, "cannot be read", "chmod u+r " + path.string()};
  const auto tree = readPropertyList(bytes);
  if (tree && tree->isDictionary()) return {subject, Verdict::Fine, "can be read", ""};
  return {subject, Verdict::Broken, tree ? "holds no dictionary" : "is damaged: " + tree.error().message,
          "the agent sets it aside at its next use; remove " + path.string() + " to have it made anew"};
}

std::vector<Verdict> cacheVerdicts(const fs::path& directory) {
  std::vector<Verdict> verdicts;
  std::error_code unknown;
  for (const auto& entry : fs::directory_iterator(directory, unknown)) {
    if (entry.path().extension() != ".plist") continue;
    auto verdict = listVerdict("cache " + entry.path().filename().string().substr(0, 8) + "…", entry.path());
    if (verdict.state != Verdict::Fine) verdicts.push_back(std::move(verdict));
  }
  if (verdicts.empty()) verdicts.push_back({"warranty cache", Verdict::Fine, "can be read", ""});
  return verdicts;
}

Verdict clockVerdict() {
  const std::time_t now = std::time(nullptr);
  if (now > kYear2024 && now < kYear2100) return {"clock", Verdict::Fine, "shows a likely time", ""};
  return {"clock", Verdict::Broken, "shows an unlikely time",
          "set it, or have it set: timedatectl set-ntp true"};
}

std::string portOf(const URL& url) {
  const auto begin = url.text().find("://") + 3;
  const auto authority = url.text().substr(begin, url.text().find_first_of("/?#", begin) - begin);
  const auto colon = authority.rfind(':');
  const bool isGiven = colon != std::string::npos && authority.find(']', colon) == std::string::npos;
  return isGiven ? authority.substr(colon + 1) : url.scheme() == "http" ? "80" : "443";
}

/// Why no connection could be made; empty on success.
std::string connectFailure(const std::string& host, const std::string& port) {
  addrinfo hints{};
  hints.ai_socktype = SOCK_STREAM;
  addrinfo* found = nullptr;
  if (const int result = ::getaddrinfo(host.c_str(), port.c_str(), &hints, &found); result != 0) {
    return ::gai_strerror(result);
  }
  const std::unique_ptr<addrinfo, void (*)(addrinfo*)> addresses(found, ::freeaddrinfo);
  std::string reason = "no address";
  for (const addrinfo* address = found; address != nullptr; address = address->ai_next) {
    const int socket = ::socket(address->ai_family, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    if (socket < 0) continue;
    int error = ::connect(socket, address->ai_addr, address->ai_addrlen) == 0 ? 0 : errno;
    if (error == EINPROGRESS) {
      pollfd waiting{socket, POLLOUT, 0};
      socklen_t size = sizeof error;
      if (::poll(&waiting, 1, kConnectLimit) <= 0 ||
          ::getsockopt(socket, SOL_SOCKET, SO_ERROR, &error, &size) < 0) {
        error = ETIMEDOUT;
      }
    }
    ::close(socket);
    if (error == 0) return {};
    reason = reasonOf(error);
  }
  return reason;
}

/// A preference that can hold an endpoint's address, and the default.
struct Endpoint {
  const char* key;
  const char* usual;
};
constexpr std::array<Endpoint, 3> kEndpoints{{{"WarrantyURL", "https://coverage.tarsil.example"},
                                              {"WearablesWarrantyURL", "https://coverage.tarsil.example"},
                                              {"ServerVersionURL", "https://assets.tarsil.example"}}};

Verdict endpointVerdict(const Endpoint& endpoint, const Value& preferences) {
  const std::string key = endpoint.key;
  const std::string text = preferences[key].stringIfAny().value_or(endpoint.usual);
  const auto url = URL::parse(text);
  if (!url) return {key, Verdict::Broken, text + " is no URL", "correct it in the agent's preferences"};
  if (url->isFile()) {
    std::error_code unknown;
    if (fs::is_regular_file(url->filePath(), unknown))
      return {key, Verdict::Fine, "a file that is there", ""};
    return {key, Verdict::Broken, url->filePath() + " is no file", "correct it in the agent's preferences"};
  }
  const auto failure = connectFailure(url->host(), portOf(*url));
  if (failure.empty()) return {key, Verdict::Fine, url->host() + " can be reached", ""};
  return {key, Verdict::Broken, url->host() + " cannot be reached: " + failure,
          "see to the network, or to " + key + " in the agent's preferences"};
}

}  // namespace

std::vector<Verdict> examine() {
  const fs::path home = LocalState::homeDirectoryOfUser();
  const auto preferences = home / names::preferencesFile();
  std::vector<Verdict> verdicts{agentVerdict(), trustVerdict(deviceRoot())};
  std::error_code unknown;
  for (const auto* file : {"Accounts.plist", "Entitlements.plist"}) {
    if (fs::exists(deviceRoot() / file, unknown)) verdicts.push_back(trustVerdict(deviceRoot() / file));
  }
  verdicts.push_back(listVerdict("preferences", preferences));
  verdicts.push_back(listVerdict("activities", home / names::activitiesFile()));
  verdicts.push_back(listVerdict("follow-ups", home / names::followUpsFile()));
  for (auto& verdict : cacheVerdicts(home / names::kCacheFolder)) {
    verdicts.push_back(std::move(verdict));
  }
  verdicts.push_back(clockVerdict());
  std::ifstream file(preferences, std::ios::binary);
  const auto tree = readPropertyList(std::string{std::istreambuf_iterator<char>(file), {}});
  for (const auto& endpoint : kEndpoints) {
    verdicts.push_back(endpointVerdict(endpoint, tree ? *tree : Value()));
  }
  return verdicts;
}

}  // namespace kvr::client
