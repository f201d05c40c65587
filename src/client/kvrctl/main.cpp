// kvrctl: asks the agent about this device, its paired devices and their warranties.

#include "client/AgentClient.h"
#include "client/Report.h"

#include <CLI/CLI.hpp>

#include <algorithm>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <string>

namespace {

using namespace kvr;          // NOLINT(google-build-using-namespace)
using namespace kvr::client;  // NOLINT(google-build-using-namespace)

enum Status { kFine = 0, kFailed = 1, kNothingKnown = 2, kUnreachable = 3, kRefused = 4 };

struct Options {
  std::string serialNumber;
  Policy policy = Policy::Default;
  bool all = false;
  bool json = false;
  bool showSerial = false;
};

void say(const std::string& message) { std::fprintf(stderr, "kvrctl: %s\n", printable(message).c_str()); }

std::string ownPath() {
  std::error_code unknown;
  return std::filesystem::read_symlink("/proc/self/exe", unknown).string();
}

int fail(const Error& error) {
  if (error.domain != kErrorDomain || error.code == OtherFailure) {
    say(error.message);
    return kFailed;
  }
  if (error.code == Refused) {
    say("the agent refuses this program: " + error.message + "; what " + ownPath() +
        " may do is stated in Entitlements.plist of the device root");
    return kRefused;
  }
  say("the agent cannot be reached: " + error.message);
  return kUnreachable;
}

int print(const std::string& text, int status) {
  if (std::fwrite(text.data(), 1, text.size(), stdout) == text.size() && std::fflush(stdout) == 0)
    return status;
  say("the output cannot be written");
  return kFailed;
}

int print(const Result<std::string>& text, int status) {
  return text ? print(*text, status) : fail(text.error());
}

int showDevice(const AgentClient& agent, const Options& options, const Report& report) {
  const Result<Device> device = agent.defaultDevice();
  if (!device) return fail(device.error());
  return options.json ? print(report.json(*device), kFine) : print(report.text(std::vector{*device}), kFine);
}

int showPaired(const AgentClient& agent, const Options& options, const Report& report) {
  const Result<std::vector<Device>> devices = agent.pairedDevices();
  if (!devices) return fail(devices.error());
  if (options.json) return print(report.json(*devices), kFine);
  return print(devices->empty() ? "No paired devices\n" : report.text(*devices), kFine);
}

Result<std::vector<DeviceInfo>> infosFor(const AgentClient& agent, const Options& options) {
  if (options.all) return agent.allDeviceInfos(options.policy, false);
  Result<DeviceInfo> info = options.serialNumber.empty()
                                ? agent.defaultDeviceInfo(options.policy)
                                : agent.deviceInfo(options.serialNumber, options.policy);
  if (!info) return info.error();
  return std::vector{*std::move(info)};
}

int showInfo(const AgentClient& agent, const Options& options, const Report& report) {
  const Result<std::vector<DeviceInfo>> infos = infosFor(agent, options);
  if (!infos) return fail(infos.error());
  const bool isKnown = std::any_of(infos->begin(), infos->end(),
                                   [](const DeviceInfo& info) { return !info.warranty.isNull(); });
  const int status = isKnown ? kFine : kNothingKnown;
  return options.json ? print(report.json(*infos), status) : print(report.text(*infos), status);
}

using Command = int (*)(const AgentClient&, const Options&, const Report&);

CLI::App* addCommand(CLI::App& app, const char* name, const char* description, Options& options) {
  CLI::App* const command = app.add_subcommand(name, description);
  command->add_flag("--json", options.json, "One JSON document instead of text");
  command->add_flag("--show-serial", options.showSerial, "Whole serial numbers instead of their ends");
  return command;
}

int run(int argumentCount, char** arguments) {
  Options options;
  std::string policy = "default";
  CLI::App app("Asks the agent about devices and their warranties.", "kvrctl");
  app.require_subcommand(1);
  app.footer(
      "Exit status: 0 fine, 2 no warranty known, 3 the agent cannot be reached, 4 it refuses this program, "
      "1 anything else.");
  CLI::App* const device = addCommand(app, "device", "This device", options);
  const CLI::App* const paired = addCommand(app, "paired", "The paired devices", options);
  CLI::App* const info = addCommand(app, "info", "A device and its warranty", options);
  CLI::Option* const serial =
      info->add_option("SERIAL", options.serialNumber, "Another device's serial number")
          ->check([](const std::string& text) {
            return text.empty() ? std::string("a serial number is not empty") : std::string();
          });
  info->add_option("--policy", policy, "Where the warranty comes from")
      ->check(CLI::IsMember({"default", "cache", "refresh"}))
      ->capture_default_str();
  info->add_flag("--all", options.all, "This device and every paired one")->excludes(serial);
  try {
    app.parse(argumentCount, arguments);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? kFine : kFailed;
  }
  if (policy == "cache") options.policy = Policy::CacheOnly;
  if (policy == "refresh") options.policy = Policy::Refresh;
  const Command command = device->parsed() ? showDevice : paired->parsed() ? showPaired : showInfo;
  const Result<AgentClient> agent = AgentClient::connect();
  if (!agent) return fail(agent.error());
  return command(*agent, options,
                 Report(options.showSerial ? Report::Serials::Whole : Report::Serials::Shortened));
}

}  // namespace

int main(int argumentCount, char** arguments) {
  try {
    return run(argumentCount, arguments);
  } catch (const std::exception& error) {
    std::fprintf(stderr, "kvrctl: %s\n", error.what());
    return kFailed;
  }
}
