// kvrctl: asks the agent about this device, its paired devices and their warranties.

#include "client/AgentClient.h"
#include "client/LocalState.h"
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

/// Writes an answer's text, or its JSON; `none` in the place of a text without anything.
template <class Answer>
int show(const Result<Answer>& answer, const Options& options, const std::string& none) {
  if (!answer) return fail(answer.error());
  const Report report(options.showSerial ? Report::Serials::Whole : Report::Serials::Shortened);
  if (options.json) return print(report.json(*answer), kFine);
  const std::string text = report.text(*answer);
  return print(text.empty() ? none + "\n" : text, kFine);
}

int showDevice(const AgentClient& agent, const Options& options) {
  const Result<Device> device = agent.defaultDevice();
  if (!device) return fail(device.error());
  if (!options.json) return show(Result(std::vector{*device}), options, {});
  return print(Report(options.showSerial ? Report::Serials::Whole : Report::Serials::Shortened).json(*device),
               kFine);
}

int showPaired(const AgentClient& agent, const Options& options) {
  return show(agent.pairedDevices(), options, "No paired devices");
}

Result<std::vector<DeviceInfo>> infosFor(const AgentClient& agent, const Options& options) {
  if (options.all) return agent.allDeviceInfos(options.policy, false);
  Result<DeviceInfo> info = options.serialNumber.empty()
                                ? agent.defaultDeviceInfo(options.policy)
                                : agent.deviceInfo(options.serialNumber, options.policy);
  if (!info) return info.error();
  return std::vector{*std::move(info)};
}

int showInfo(const AgentClient& agent, const Options& options) {
  const Result<std::vector<DeviceInfo>> infos = infosFor(agent, options);
  const int shown = show(infos, options, {});
  if (shown != kFine) return shown;
  const bool isKnown = std::any_of(infos->begin(), infos->end(),
                                   [](const DeviceInfo& info) { return !info.warranty.isNull(); });
  return isKnown ? kFine : kNothingKnown;
}

int dismiss(const AgentClient& agent, const Options& options) {
  const Result<bool> answer = agent.dismissFollowUp(options.serialNumber);
  return answer ? kFine : fail(answer.error());
}

using AgentCommand = int (*)(const AgentClient&, const Options&);

int withAgent(AgentCommand command, const Options& options) {
  const Result<AgentClient> agent = AgentClient::connect();
  return agent ? command(*agent, options) : fail(agent.error());
}

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
  const CLI::App* const followUps = addCommand(app, "follow-ups", "The offers that are shown", options);
  const CLI::App* const activities =
      addCommand(app, "activities", "The background activities to come", options);
  CLI::App* const dismissal = app.add_subcommand("dismiss", "Takes a device's offer away");
  dismissal->add_option("SERIAL", options.serialNumber, "The device's serial number")->required();
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
  if (followUps->parsed()) return show(LocalState().followUps(), options, "No follow-ups");
  if (activities->parsed()) return show(LocalState().activities(), options, "No activities");
  if (dismissal->parsed()) return withAgent(dismiss, options);
  return withAgent(device->parsed() ? showDevice : paired->parsed() ? showPaired : showInfo, options);
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
