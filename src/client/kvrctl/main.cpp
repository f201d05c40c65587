// kvrctl: asks the agent about this device, its paired devices and their warranties.

#include "client/AgentClient.h"
#include "client/LocalState.h"
#include "client/Report.h"
#include "client/Timeline.h"
#include "client/kvrctl/Doctor.h"
#include "client/kvrctl/Monitor.h"

#include <CLI/CLI.hpp>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <clocale>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>

namespace {

using namespace kvr;          // NOLINT(google-build-using-namespace)
using namespace kvr::client;  // NOLINT(google-build-using-namespace)

enum Status { kFine = 0, kFailed = 1, kNothingKnown = 2, kUnreachable = 3, kRefused = 4 };

struct Options {
  std::string serialNumber;
  std::string text;
  std::string file;
  double seconds = 0;
  bool noWait = false;
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

Report reportFor(const Options& options) {
  return Report(options.showSerial ? Report::Serials::Whole : Report::Serials::Shortened);
}

/// Writes an answer's text, or its JSON; `none` in the place of a text without anything.
template <class Answer>
int show(const Result<Answer>& answer, const Options& options, const std::string& none) {
  if (!answer) return fail(answer.error());
  const Report report = reportFor(options);
  if (options.json) return print(report.json(*answer), kFine);
  const std::string text = report.text(*answer);
  return print(text.empty() ? none + "\n" : text, kFine);
}

int showDevice(const AgentClient& agent, const Options& options) {
  const Result<Device> device = agent.defaultDevice();
  if (!device) return fail(device.error());
  if (!options.json) return show(Result(std::vector{*device}), options, {});
  return print(reportFor(options).json(*device), kFine);
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
  const Result<bool> answer = agent.dismissFollowUp(options.text);
  return answer ? kFine : fail(answer.error());
}

int scheduleOutreach(const AgentClient& agent, const Options& options) {
  const Result<bool> answer = agent.scheduleOutreach(options.seconds);
  return answer ? kFine : fail(answer.error());
}

int reportAccountAdded(const AgentClient& agent, const Options& options) {
  if (options.noWait) {
    const auto error = agent.tell("TarsilAccountAdded");
    return error ? fail(*error) : kFine;
  }
  if (::isatty(STDERR_FILENO) == 1)
    say("the agent may take an hour to answer; --no-wait does not wait for it");
  const Result<bool> answer = agent.accountAdded();
  if (!answer) return fail(answer.error());
  return print(*answer ? "The agent has looked into it\n" : "The agent has not been set up yet\n",
               *answer ? kFine : kNothingKnown);
}

int showSupportApplication(const AgentClient& agent, const Options& options) {
  const Result<Value> answer = agent.supportApplication(options.text);
  if (!answer) return fail(answer.error());
  const auto report = reportFor(options);
  return options.json ? print(report.json("supportApplication", *answer), kFine)
                      : print(report.text(*answer), kFine);
}

int showWebURL(const AgentClient& agent, const Options& options) {
  const Result<std::optional<std::string>> answer = agent.webURLOverride();
  if (!answer) return fail(answer.error());
  const int status = *answer ? kFine : kNothingKnown;
  if (options.json) return print(reportFor(options).json("webURL", Value(*answer)), status);
  return print(*answer ? printable(**answer) + "\n" : "No override\n", status);
}

Date now() {
  using Seconds = std::chrono::duration<double>;
  return {std::chrono::duration_cast<Seconds>(std::chrono::system_clock::now().time_since_epoch()).count()};
}

/// Each device with what is known of it, here and at the agent.
Result<std::vector<DeviceStatus>> statusesFrom(const AgentClient& agent, Policy policy) {
  const auto infos = agent.allDeviceInfos(policy, false);
  if (!infos) return infos.error();
  const LocalState state;
  const auto followUps = state.followUps();
  std::vector<DeviceStatus> statuses;
  for (const auto& info : *infos) {
    DeviceStatus status{info.device, std::nullopt, false, std::nullopt, now()};
    if (!info.warranty.isNull()) status.coverage = Coverage::from(info.warranty);
    if (const auto& serialNumber = info.device.serialNumber) {
      status.hasFollowUp = followUps && std::ranges::find(*followUps, serialNumber,
                                                          &FollowUp::serialNumber) != followUps->end();
      if (const auto downloaded = state.downloadedDate(*serialNumber)) status.downloaded = *downloaded;
    }
    statuses.push_back(std::move(status));
  }
  std::ranges::sort(statuses, {}, [](const DeviceStatus& status) {
    return std::pair(status.device.deviceType, status.device.name.value_or(""));
  });
  return statuses;
}

int showStatuses(const AgentClient& agent, const Options& options, Policy policy) {
  const auto statuses = statusesFrom(agent, policy);
  if (!statuses) return fail(statuses.error());
  const bool isKnown =
      std::ranges::any_of(*statuses, [](const auto& status) { return status.coverage.has_value(); });
  const auto report = reportFor(options);
  const int status = isKnown ? kFine : kNothingKnown;
  return options.json ? print(report.json(*statuses), status)
                      : print(report.text(*statuses, Style::ofOutput()), status);
}

int showStatus(const AgentClient& agent, const Options& options) {
  return showStatuses(agent, options, Policy::CacheOnly);
}

int refresh(const AgentClient& agent, const Options& options) {
  return showStatuses(agent, options, Policy::Refresh);
}

int showTimeline(const AgentClient& agent, const Options& options) {
  const auto statuses = statusesFrom(agent, Policy::CacheOnly);
  if (!statuses) return fail(statuses.error());
  const LocalState state;
  const auto followUps = state.followUps();
  const auto activities = state.activities();
  if (!followUps || !activities) return fail(followUps ? activities.error() : followUps.error());
  const Timeline timeline(*statuses, *followUps, *activities, now());
  if (options.file.empty()) {
    winsize size{};
    const bool isKnown = ::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0;
    return print(timeline.text(Style::ofOutput(), isKnown ? size.ws_col - 12U : 88U), kFine);
  }
  std::ofstream file(options.file, std::ios::trunc);
  if (file << timeline.svg() << std::flush) return kFine;
  say(options.file + " cannot be written: " + std::generic_category().message(errno));
  return kFailed;
}

int notify(const AgentClient& agent, const Options& options) {
  const auto error = agent.post(options.text);
  return error ? fail(*error) : kFine;
}

int showVerdicts(const Options& options) {
  const auto verdicts = examine();
  const Style style = Style::ofOutput();
  Value::Array trees;
  Table table({"", "", "", ""});
  int status = kFine;
  for (const auto& [subject, state, finding, cure] : verdicts) {
    constexpr std::array<const char*, 3> kMarks{"fine", "look", "broken"};
    constexpr std::array<Style::Paint, 3> kPaints{Style::Good, Style::Notice, Style::Bad};
    if (state == Verdict::Broken) status = kFailed;
    trees.emplace_back(Value::Dictionary{
        {"subject", subject}, {"verdict", kMarks[state]}, {"finding", finding}, {"cure", cure}});
    table.add({style.paint(kPaints[state], kMarks[state]), printable(subject), printable(finding),
               cure.empty() ? "" : "→ " + printable(cure)});
  }
  if (options.json) return print(reportFor(options).json("verdicts", trees), status);
  const std::string text = table.text();
  return print(text.substr(text.find('\n') + 1), status);
}

using AgentCommand = int (*)(const AgentClient&, const Options&);

int withAgent(AgentCommand command, const Options& options) {
  Result<AgentClient> connected = AgentClient::connect();
  if (!connected) return fail(connected.error());
  AgentClient agent = *std::move(connected);
  const bool isWatched = ::isatty(STDERR_FILENO) == 1;
  if (isWatched) {
    agent.setWaiting([](int seconds) { std::fprintf(stderr, "\rwaiting for the agent, %d s ", seconds); });
  }
  const int status = command(agent, options);
  if (isWatched) std::fprintf(stderr, "\r\033[K");
  return status;
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
  app.require_subcommand(0, 1);
  app.footer(
      "Exit status: 0 fine, 2 nothing known, 3 the agent cannot be reached, 4 it refuses this program, "
      "1 anything else.");
  std::map<const CLI::App*, AgentCommand> commands;
  const auto add = [&](const char* name, const char* description, AgentCommand command) {
    CLI::App* const added = addCommand(app, name, description, options);
    commands.emplace(added, command);
    return added;
  };
  // One whose answer is no document.
  const auto addPlain = [&](const char* name, const char* description, AgentCommand command) {
    CLI::App* const added = app.add_subcommand(name, description);
    commands.emplace(added, command);
    return added;
  };
  const auto isText = [](const std::string& text) {
    return text.empty() ? std::string("it is empty") : std::string();
  };
  add("status", "Every device at a glance, from what is known already (the default)", showStatus);
  add("device", "This device", showDevice);
  add("paired", "The paired devices", showPaired);
  CLI::App* const info = add("info", "A device and its warranty", showInfo);
  CLI::Option* const serial =
      info->add_option("SERIAL", options.serialNumber, "Another device's serial number")->check(isText);
  info->add_option("--policy", policy, "Where the warranty comes from")
      ->check(CLI::IsMember({"default", "cache", "refresh"}))
      ->capture_default_str();
  info->add_flag("--all", options.all, "This device and every paired one")->excludes(serial);
  add("refresh", "Downloads every device's warranty anew", refresh);
  addPlain("dismiss", "Takes a device's offer away", dismiss)
      ->add_option("SERIAL", options.text, "The device's serial number")
      ->required()
      ->check(isText);
  addPlain("schedule-outreach", "Has the agent ask about every device by itself", scheduleOutreach)
      ->add_option("--after", options.seconds, "So many seconds from now");
  addPlain("account-added", "Tells the agent that a cloud account was added", reportAccountAdded)
      ->add_flag("--no-wait", options.noWait, "Does not wait for the answer, which may take an hour");
  add("support-app", "How an application stands on this device", showSupportApplication)
      ->add_option("BUNDLE", options.text, "Its bundle identifier")
      ->required()
      ->check(isText);
  add("web-url", "The override of the web flow's address", showWebURL);
  addPlain("timeline", "Coverage, offers and activities on one axis of dates", showTimeline)
      ->add_option("--svg", options.file, "Draws a picture into this file instead");
  addPlain("notify", "Posts a notification to everyone on the bus", notify)
      ->add_option("NAME", options.text, "Its name")
      ->required()
      ->check(isText);
  const CLI::App* const followUps = addCommand(app, "follow-ups", "The offers that are shown", options);
  const CLI::App* const activities =
      addCommand(app, "activities", "The background activities to come", options);
  const CLI::App* const watching = addCommand(app, "monitor", "What changes, as it happens", options);
  const CLI::App* const doctor = addCommand(app, "doctor", "What is wrong, and what helps", options);
  try {
    app.parse(argumentCount, arguments);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? kFine : kFailed;
  }
  if (policy == "cache") options.policy = Policy::CacheOnly;
  if (policy == "refresh") options.policy = Policy::Refresh;
  if (followUps->parsed()) return show(LocalState().followUps(), options, "No follow-ups");
  if (activities->parsed()) return show(LocalState().activities(), options, "No activities");
  if (watching->parsed()) return monitor(reportFor(options));
  if (doctor->parsed()) return showVerdicts(options);
  for (const auto& [command, operation] : commands) {
    if (command->parsed()) return withAgent(operation, options);
  }
  return withAgent(showStatus, options);
}

}  // namespace

int main(int argumentCount, char** arguments) {
  std::setlocale(LC_TIME, "");
  try {
    return run(argumentCount, arguments);
  } catch (const std::exception& error) {
    std::fprintf(stderr, "kvrctl: %s\n", error.what());
    return kFailed;
  }
}
