#include "Programs.h"

#include "CoverageAnswer.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <system_error>
#include <thread>

namespace kvr::bench {
namespace {

constexpr const char* kBarePath = "/com/tarsil/kvragent/bare";
constexpr const char* kBareInterface = "com.tarsil.kvragent.Bare";
constexpr std::uint64_t kLimitMicroseconds = 60'000'000;
/// A changed file is parsed at every read for less than this time.
constexpr std::chrono::milliseconds kSettling{100};

/// Writes a value in the format of the bare service.
void write(std::ostream& file, const Value& value, const std::string& key) {
  const auto open = [&](char kind) -> std::ostream& {
    return file << kind << (key.empty() ? "" : " ") << key;
  };
  switch (value.kind()) {
    case Value::Kind::Bool:
      open('b') << ' ' << value.boolean() << '\n';
      return;
    case Value::Kind::Int:
      open(key == "deviceType" ? 't' : 'x') << ' ' << value.integer() << '\n';
      return;
    case Value::Kind::Real:
      open('d') << ' ' << value.real() << '\n';
      return;
    case Value::Kind::Date:
      open('(') << ' ' << value.date().secondsSince1970 << '\n';
      return;
    case Value::Kind::String:
      open('s') << ' ' << value.string() << '\n';
      return;
    case Value::Kind::Array:
      open('[') << '\n';
      for (const Value& element : value.array()) write(file, element, {});
      file << "]\n";
      return;
    case Value::Kind::Dictionary:
      open('{') << '\n';
      for (const auto& [name, element] : value.dictionary()) write(file, element, name);
      file << "}\n";
      return;
    default:
      throw std::runtime_error("the bare service has no such value: " + describe(value));
  }
}

BusMessageRef callOf(const RawBusClient& client, const char* name, const char* path, const char* interface,
                     const char* member) {
  sd_bus_message* message = nullptr;
  if (sd_bus_message_new_method_call(client.bus(), &message, name, path, interface, member) < 0) {
    throw std::runtime_error("no call can be made");
  }
  return BusMessageRef(message);
}

/// The sum of the values, in KiB, of all lines in a process's memory map that begin with this text.
double memoryNamed(pid_t process, std::string_view beginning) {
  std::ifstream file("/proc/" + std::to_string(process) + "/smaps_rollup");
  double sum = 0;
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with(beginning)) sum += std::stod(line.substr(line.find(':') + 1));
  }
  return sum;
}

}  // namespace

Program::Program(std::vector<std::string> arguments, std::vector<std::string> environment) {
  const auto pointers = [](std::vector<std::string>& texts) {
    std::vector<char*> result;
    result.reserve(texts.size() + 1);
    for (std::string& text : texts) result.push_back(text.data());
    result.push_back(nullptr);
    return result;
  };
  posix_spawn_file_actions_t actions;
  ::posix_spawn_file_actions_init(&actions);
  for (const int descriptor : {STDOUT_FILENO, STDERR_FILENO}) {
    ::posix_spawn_file_actions_addopen(&actions, descriptor, "/dev/null", O_WRONLY, 0);
  }
  const int error = ::posix_spawn(&pid_, arguments.at(0).c_str(), &actions, nullptr,
                                  pointers(arguments).data(), pointers(environment).data());
  ::posix_spawn_file_actions_destroy(&actions);
  if (error != 0) throw std::system_error(error, std::generic_category(), arguments.at(0));
}

Program::~Program() {
  ::kill(pid_, SIGKILL);
  ::waitpid(pid_, nullptr, 0);
}

Programs::Programs() { world.setCoverage("default", coverageAnswer()); }

std::unique_ptr<Program> Programs::run(const std::string& program, std::vector<std::string> arguments) const {
  arguments.insert(arguments.begin(), std::string(KVR_PROGRAMS) + "/" + program);
  return std::make_unique<Program>(
      std::move(arguments),
      std::vector<std::string>{"HOME=" + world.home().string(), "LC_ALL=C",
                               "KVR_DEVICE_ROOT=" + (world.directory / "device").string(),
                               "DBUS_SESSION_BUS_ADDRESS=" + world.bus.address()});
}

void Programs::waitForName(const char* name) const {
  const RawBusClient watcher = newClient();
  const std::string rule =
      std::string("type='signal',sender='org.freedesktop.DBus',member='NameOwnerChanged',arg0='") + name +
      "'";
  sd_bus_add_match(watcher.bus(), nullptr, rule.c_str(), nullptr, nullptr);
  while (sd_bus_get_name_creds(watcher.bus(), name, 0, nullptr) < 0) {
    if (sd_bus_process(watcher.bus(), nullptr) > 0) continue;
    if (sd_bus_wait(watcher.bus(), kLimitMicroseconds) == 0) {
      throw std::runtime_error(std::string(name) + " did not come");
    }
  }
}

void Programs::startAgent() {
  stopAgent();
  for (const auto* path : {"Library", "Library/Preferences", "Library/Activities"}) {
    std::filesystem::permissions(world.home() / path, std::filesystem::perms::owner_all);
  }
  agent_ = run("kvragent");
  waitForName(RawBusClient::kName);
}

void Programs::startBare(const Value& tree) {
  stopBare();
  std::vector<std::string> arguments;
  if (!tree.isNull()) {
    std::ostringstream lines;
    lines.precision(17);
    for (const auto& [key, value] : tree.dictionary()) write(lines, value, key);
    arguments.push_back(world.directory.write("bare-tree", lines.str()).string());
  }
  bare_ = run("kvr-bench-bare", std::move(arguments));
  waitForName(kBareName);
}

void Programs::fillCache() const {
  const RawBusClient client = newClient();
  const Value info = client.value("a{sv}", {answerTo(client, infoCall(client, AgentWorld::Refresh)), {}, {}});
  if (AgentWorld::warrantyIn(info).isNull())
    throw std::runtime_error("the agent has not downloaded anything");
  std::this_thread::sleep_for(kSettling);
}

BusMessageRef infoCall(const RawBusClient& client, std::uint64_t policy) {
  return client.newCall("GetDefaultDeviceInfoUsingPolicy", "t", {Value(policy)});
}

BusMessageRef bareInfoCall(const RawBusClient& client) {
  BusMessageRef call = callOf(client, Programs::kBareName, kBarePath, kBareInterface, "Info");
  sd_bus_message_append(call.get(), "t", std::uint64_t{1});
  return call;
}

BusMessageRef allInfosCall(const RawBusClient& client) {
  return client.newCall("GetAllDeviceInfosUsingPolicy", "tb", {std::uint64_t{AgentWorld::CacheOnly}, false});
}

BusMessageRef bareAllInfosCall(const RawBusClient& client) {
  BusMessageRef call = callOf(client, Programs::kBareName, kBarePath, kBareInterface, "Infos");
  sd_bus_message_append(call.get(), "tb", std::uint64_t{1}, 0);
  return call;
}

BusMessageRef pingCall(const RawBusClient& client) {
  return callOf(client, Programs::kBareName, kBarePath, kBareInterface, "Ping");
}

BusMessageRef answerTo(const RawBusClient& client, const BusMessageRef& call) {
  auto reply = client.call(call);
  if (!reply.message) throw std::runtime_error(reply.error + ": " + reply.errorText);
  return std::move(reply.message);
}

double privateMemory(pid_t process) { return memoryNamed(process, "Private_"); }

double writtenMemory(pid_t process) { return memoryNamed(process, "Private_Dirty:"); }

std::int64_t contextSwitches(pid_t process) {
  std::int64_t sum = 0;
  for (const auto& thread :
       std::filesystem::directory_iterator("/proc/" + std::to_string(process) + "/task")) {
    std::ifstream file(thread.path() / "status");
    for (std::string line; std::getline(file, line);) {
      if (line.find("ctxt_switches:") != std::string::npos)
        sum += std::stoll(line.substr(line.find(':') + 1));
    }
  }
  return sum;
}

}  // namespace kvr::bench
