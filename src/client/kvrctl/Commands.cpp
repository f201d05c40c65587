#include "client/kvrctl/Commands.h"

#include "client/LocalState.h"
#include "client/kvrctl/Doctor.h"
#include "client/kvrctl/Table.h"
#include "client/kvrctl/Timeline.h"
#include "local/device/DeviceRoot.h"
#include "local/device/LocalNetwork.h"
#include "platform/codec/PropertyList.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <fstream>
#include <iterator>

namespace kvr::client {
namespace {

constexpr std::string_view kShortened = "…";

Date now() {
  using Seconds = std::chrono::duration<double>;
  return {std::chrono::duration_cast<Seconds>(std::chrono::system_clock::now().time_since_epoch()).count()};
}

/// Prints an answer as text or JSON; prints `none` instead of an empty text.
template <class Answer>
Status show(const Result<Answer>& answer, const Options& options, const std::string& none) {
  if (!answer) return fail(answer.error());
  const Report report = options.report();
  if (options.json) return print(report.json(*answer), kFine);
  const std::string text = report.text(*answer, Style::ofOutput());
  return print(text.empty() ? none + "\n" : text, kFine);
}

/// Prints a confirmation: `line`, or in JSON `fact` under `name`.
Status confirm(const Options& options, const std::string& line, std::string_view name, const Value& fact) {
  return options.json ? print(Report::json(name, fact), kFine) : print(printable(line) + "\n", kFine);
}

/// The follow-ups that are shown. The follow-up centre drops one whose date has passed, but not from the
/// file.
Result<std::vector<FollowUp>> shownFollowUps() {
  auto stored = LocalState().followUps();
  if (!stored) return stored;
  std::vector<FollowUp> shown = *std::move(stored);
  std::erase_if(shown, [date = now()](const FollowUp& followUp) {
    return followUp.expirationDate && *followUp.expirationDate <= date;
  });
  return shown;
}

Result<std::vector<Device>> knownDevices(const AgentClient& agent) {
  const auto own = agent.defaultDevice();
  if (!own) return own.error();
  auto devices = agent.pairedDevices();
  if (!devices) return devices.error();
  std::vector<Device> known = *std::move(devices);
  known.insert(known.begin(), *own);
  return known;
}

/// Completes a serial number given in its shortened form; returns it unchanged when no device ends in it.
Result<std::string> wholeSerial(const AgentClient& agent, const std::string& given) {
  if (!given.starts_with(kShortened)) return given;
  const auto devices = knownDevices(agent);
  if (!devices) return devices.error();
  const auto end = given.substr(kShortened.size());
  std::vector<std::string> found;
  for (const Device& device : *devices) {
    if (device.serialNumber == given) return given;
    if (device.serialNumber && device.serialNumber->ends_with(end)) found.push_back(*device.serialNumber);
  }
  if (found.empty()) return given;
  if (found.size() == 1) return found.front();
  return Error{"kvrctl", 0, "more than one serial number ends so; --show-serial shows them whole"};
}

/// Whether the serial number belongs to this device, a paired one, or a follow-up still shown; prints an
/// error if not.
bool isKnownDevice(const AgentClient& agent, const std::string& serialNumber, const Options& options) {
  const auto devices = knownDevices(agent);
  if (!devices || std::ranges::find(*devices, serialNumber, &Device::serialNumber) != devices->end()) {
    return true;
  }
  const auto followUps = LocalState().followUps();
  if (followUps && std::ranges::find(*followUps, serialNumber, &FollowUp::serialNumber) != followUps->end()) {
    return true;
  }
  say("no device has the serial number " + options.report().serial(serialNumber) +
      "; kvrctl device and kvrctl paired tell which there are");
  return false;
}

Result<std::vector<DeviceInfo>> infosFor(const AgentClient& agent, const Options& options,
                                         const std::optional<std::string>& serialNumber) {
  if (options.all) return agent.allDeviceInfos(options.policy, false);
  Result<DeviceInfo> info = serialNumber ? agent.deviceInfo(*serialNumber, options.policy)
                                         : agent.defaultDeviceInfo(options.policy);
  if (!info) return info.error();
  return std::vector{*std::move(info)};
}

/// The status of each device, from the agent and from its files.
Result<std::vector<DeviceStatus>> statusesFrom(const AgentClient& agent, Policy policy) {
  const auto infos = agent.allDeviceInfos(policy, false);
  if (!infos) return infos.error();
  const LocalState state;
  const auto followUps = shownFollowUps();
  std::vector<DeviceStatus> statuses;
  for (const auto& info : *infos) {
    DeviceStatus status;
    status.device = info.device;
    status.now = now();
    if (!info.warranty.isNull()) status.coverage = Coverage::from(info.warranty);
    if (const auto& serialNumber = info.device.serialNumber) {
      status.hasFollowUp = followUps && std::ranges::find(*followUps, serialNumber,
                                                          &FollowUp::serialNumber) != followUps->end();
      status.isDismissed = state.isDismissed(*serialNumber);
      if (const auto downloaded = state.downloadedDate(*serialNumber)) status.downloaded = *downloaded;
    }
    statuses.push_back(std::move(status));
  }
  std::ranges::sort(statuses, {}, [](const DeviceStatus& status) {
    return std::pair(status.device.deviceType, status.device.name.value_or(""));
  });
  return statuses;
}

Status showStatuses(const AgentClient& agent, const Options& options, Policy policy) {
  const auto statuses = statusesFrom(agent, policy);
  if (!statuses) return fail(statuses.error());
  const bool isKnown =
      std::ranges::any_of(*statuses, [](const auto& status) { return status.coverage.has_value(); });
  const Status status = isKnown ? kFine : kNothingKnown;
  const Report report = options.report();
  return options.json ? print(report.json(*statuses), status)
                      : print(report.text(*statuses, Style::ofOutput()), status);
}

Circumstances circumstances() {
  const auto agent = AgentClient::connect();
  std::ifstream file(DeviceRoot::directoryFromEnvironment() + "/Network.plist", std::ios::binary);
  const auto network = readPropertyList(std::string{std::istreambuf_iterator<char>(file), {}});
  return {now(), agent && agent->isAgentRunning(), LocalNetwork::isReachable(network ? *network : Value())};
}

}  // namespace

Status showStatus(const AgentClient& agent, const Options& options) {
  return showStatuses(agent, options, Policy::CacheOnly);
}

Status refresh(const AgentClient& agent, const Options& options) {
  return showStatuses(agent, options, Policy::Refresh);
}

Status showDevice(const AgentClient& agent, const Options& options) {
  const Result<Device> device = agent.defaultDevice();
  if (!device) return fail(device.error());
  if (options.json) return print(options.report().json(*device), kFine);
  return show(Result(std::vector{*device}), options, {});
}

Status showPaired(const AgentClient& agent, const Options& options) {
  return show(agent.pairedDevices(), options, "No paired devices");
}

Status showInfo(const AgentClient& agent, const Options& options) {
  auto serialNumber = options.serialNumber;
  if (serialNumber) {
    const auto whole = wholeSerial(agent, *serialNumber);
    if (!whole) return fail(whole.error());
    serialNumber = *whole;
  }
  const auto infos = infosFor(agent, options, serialNumber);
  const Status shown = show(infos, options, {});
  if (shown != kFine) return shown;
  const auto isKnown = [](const DeviceInfo& info) { return !info.warranty.isNull(); };
  if (std::ranges::any_of(*infos, isKnown)) return kFine;
  if (serialNumber) isKnownDevice(agent, *serialNumber, options);
  return kNothingKnown;
}

Status dismiss(const AgentClient& agent, const Options& options) {
  const auto serialNumber = wholeSerial(agent, options.serialNumber.value_or(""));
  if (!serialNumber) return fail(serialNumber.error());
  if (!isKnownDevice(agent, *serialNumber, options)) return kNothingKnown;
  const Result<bool> answer = agent.dismissFollowUp(*serialNumber);
  if (!answer) return fail(answer.error());
  return confirm(options, "The offer for " + options.report().serial(*serialNumber) + " is dismissed",
                 "dismissed", *answer);
}

Status scheduleOutreach(const AgentClient& agent, const Options& options) {
  const Result<bool> answer = agent.scheduleOutreach(options.seconds);
  if (!answer) return fail(answer.error());
  return confirm(options, "Outreach is scheduled; kvrctl activities shows when", "scheduled", *answer);
}

Status reportAccountAdded(const AgentClient& agent, const Options& options) {
  if (options.noWait) {
    const auto error = agent.tell("TarsilAccountAdded");
    return error ? fail(*error) : confirm(options, "The agent has been told", "handled", Value());
  }
  if (::isatty(STDERR_FILENO) == 1) {
    say("the agent may take an hour to answer; --no-wait does not wait for it");
  }
  const Result<bool> answer = agent.accountAdded();
  if (!answer) return fail(answer.error());
  const Status written = confirm(
      options,
      *answer ? "The agent has looked into it" : "The agent has not been set up yet, or found nothing",
      "handled", *answer);
  return written == kFine && !*answer ? kNothingKnown : written;
}

Status showSupportApplication(const AgentClient& agent, const Options& options) {
  const Result<Value> answer = agent.supportApplication(options.text);
  if (!answer) return fail(answer.error());
  return options.json ? print(Report::json("supportApplication", *answer), kFine)
                      : print(Report::text(*answer, Style::ofOutput()), kFine);
}

Status showWebURL(const AgentClient& agent, const Options& options) {
  const Result<std::optional<std::string>> answer = agent.webURLOverride();
  if (!answer) return fail(answer.error());
  const Status written = confirm(options, answer->value_or("No override"), "webURL", Value(*answer));
  return written == kFine && !*answer ? kNothingKnown : written;
}

Status showTimeline(const AgentClient& agent, const Options& options) {
  auto serialNumber = options.serialNumber;
  if (serialNumber) {
    const auto whole = wholeSerial(agent, *serialNumber);
    if (!whole) return fail(whole.error());
    if (!isKnownDevice(agent, *whole, options)) return kNothingKnown;
    serialNumber = *whole;
  }
  const auto statuses = statusesFrom(agent, Policy::CacheOnly);
  if (!statuses) return fail(statuses.error());
  const auto followUps = shownFollowUps();
  const auto activities = LocalState().activities();
  if (!followUps || !activities) return fail(followUps ? activities.error() : followUps.error());
  const Timeline timeline(*statuses, *followUps, *activities, now(), serialNumber);
  if (options.file == "-") return print(timeline.svg(), kFine);
  if (!options.file.empty()) {
    std::ofstream file(options.file, std::ios::trunc);
    if (!(file << timeline.svg() << std::flush)) {
      return fail(
          {"kvrctl", errno, options.file + " cannot be written: " + std::generic_category().message(errno)});
    }
    if (!options.json) return kFine;
  }
  if (options.json) return print(Report::json("timeline", timeline.tree()), kFine);
  return print(timeline.text(Style::ofOutput()), kFine);
}

Status postNotification(const AgentClient& agent, const Options& options) {
  const auto error = agent.post(options.text);
  return error ? fail(*error) : confirm(options, options.text + " is posted", "posted", options.text);
}

Status showFollowUps(const Options& options) { return show(shownFollowUps(), options, "No follow-ups"); }

Status showActivities(const Options& options) {
  const auto activities = LocalState().activities();
  if (!activities) return fail(activities.error());
  const auto facts = circumstances();
  if (options.json) return print(Report::json(*activities, facts), kFine);
  const std::string text = Report::text(*activities, facts, Style::ofOutput());
  return print(text.empty() ? "No activities\n" : text, kFine);
}

Status showVerdicts(const Options& options) {
  constexpr std::array<const char*, 3> kMarks{"fine", "look", "broken"};
  constexpr std::array<Style::Paint, 3> kPaints{Style::Good, Style::Notice, Style::Bad};
  Value::Array trees;
  Table table({{"Verdict"}, {"Of", 12}, {"Finding", 20}, {"Cure", 20}});
  Status status = kFine;
  for (const auto& [subject, state, finding, cure] : examine()) {
    if (state == Verdict::Broken) status = kFailed;
    trees.emplace_back(Value::Dictionary{
        {"subject", subject}, {"verdict", kMarks[state]}, {"finding", finding}, {"cure", cure}});
    table.add({{kMarks[state], kPaints[state]}, printable(subject), printable(finding), printable(cure)});
  }
  return options.json ? print(Report::json("verdicts", trees), status)
                      : print(table.text(Style::ofOutput()), status);
}

}  // namespace kvr::client
