#include "client/kvrctl/Monitor.h"

#include "client/AgentClient.h"
#include "client/LocalState.h"
#include "client/kvrctl/Changes.h"
#include "client/kvrctl/Output.h"
#include "client/kvrctl/Terminal.h"
#include "local/buscodec/BusHandles.h"
#include "local/loop/EventLoop.h"
#include "local/loop/FileWatch.h"
#include "local/system/LocalLog.h"
#include "platform/names/Names.h"

#include <systemd/sd-event.h>

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <functional>
#include <initializer_list>
#include <map>

namespace kvr::client {
namespace {

/// Prints each event as one line: text or a JSON document.
class Teller {
 public:
  explicit Teller(bool inJSON) : inJSON_(inJSON) {}

  /// `subject` is the kind of thing, `event` what happened to it, `detail` its new state, if it has one.
  void tell(const std::string& subject, const std::string& name, const std::string& event,
            const std::string& detail = {}) const {
    using Seconds = std::chrono::duration<double>;
    const Date now{
        std::chrono::duration_cast<Seconds>(std::chrono::system_clock::now().time_since_epoch()).count()};
    if (inJSON_) {
      Value::Dictionary tree{{"date", now}, {"subject", subject}, {"event", event}};
      if (!name.empty()) tree.emplace("name", name);
      if (!detail.empty()) tree.emplace("detail", detail);
      print(Report::json("event", tree), kFine);
      return;
    }
    std::string line = subject;
    for (const auto* word : {&name, &event}) line += word->empty() ? "" : " " + *word;
    if (!detail.empty()) line += ": " + detail;
    print(Style::second(now) + "  " + printable(line) + "\n", kFine);
  }

 private:
  const bool inJSON_;
};

/// Reports lines that were added, removed or changed since the last look; each line has a unique name.
class Differences {
 public:
  using Lines = std::map<std::string, std::string>;

  Differences(const Teller& teller, std::string subject, std::function<Lines()> look)
      : teller_(teller), subject_(std::move(subject)), look_(std::move(look)), lines_(look_()) {}

  void update() {
    Lines lines = look_();
    for (const auto& [name, line] : lines) {
      const auto before = lines_.find(name);
      if (before == lines_.end()) teller_.tell(subject_, name, "added", line);
      if (before != lines_.end() && before->second != line) teller_.tell(subject_, name, "changed", line);
    }
    for (const auto& [name, line] : lines_) {
      if (!lines.contains(name)) teller_.tell(subject_, name, "gone");
    }
    lines_ = std::move(lines);
  }

 private:
  const Teller& teller_;
  const std::string subject_;
  const std::function<Lines()> look_;
  Lines lines_;
};

Differences::Lines followUpLines(const LocalState& state, const Report& report) {
  Differences::Lines lines;
  const auto followUps = state.followUps();
  if (!followUps) return lines;
  for (const auto& followUp : *followUps) {
    lines[followUp.serialNumber ? report.serial(*followUp.serialNumber) : "of no device"] =
        followUp.title.value_or("untitled") + ", " + followUp.text.value_or("") +
        (followUp.hasBadge ? ", badge" : "");
  }
  return lines;
}

Differences::Lines activityLines(const LocalState& state) {
  Differences::Lines lines;
  const auto activities = state.activities();
  if (!activities) return lines;
  const auto dateText = [](const std::optional<Date>& date) { return date ? Style::moment(*date) : "none"; };
  for (const auto& activity : *activities) {
    std::string& line = lines[activity.identifier];
    if (activity.isToCome()) {
      line = "not before " + dateText(activity.targetDate) + ", due " + dateText(activity.dueDate);
    }
    if (activity.lastResult) {
      line += (line.empty() ? "" : "; ") + *activity.lastResult + " " + dateText(activity.lastEnd);
    }
  }
  return lines;
}

Differences::Lines downloadLines(const LocalState& state) {
  Differences::Lines lines;
  const auto downloads = state.downloads();
  if (!downloads) return lines;
  for (const auto& [device, date] : *downloads) lines[device.substr(0, 8) + "…"] = Style::moment(date);
  return lines;
}

int handlePosted(sd_bus_message* message, void* teller, sd_bus_error*) {
  return guardedBusCallback([&] {
    const char* name = nullptr;
    if (sd_bus_message_read(message, "s", &name) >= 0) {
      static_cast<const Teller*>(teller)->tell("notification", name, "posted");
    }
    return 0;
  });
}

int handleOwner(sd_bus_message* message, void* teller, sd_bus_error*) {
  return guardedBusCallback([&] {
    const char* name = nullptr;
    const char* before = nullptr;
    const char* now = nullptr;
    if (sd_bus_message_read(message, "sss", &name, &before, &now) >= 0) {
      static_cast<const Teller*>(teller)->tell("agent", "", *now != '\0' ? "started" : "ended");
    }
    return 0;
  });
}

/// Ends the loop on these signals, which must be blocked in every thread.
void endWith(EventLoop& loop, std::initializer_list<int> signals) {
  for (const int signal : signals) {
    sd_event_add_signal(
        loop.event(), nullptr, signal,
        [](sd_event_source*, const signalfd_siginfo*, void* it) {
          static_cast<EventLoop*>(it)->exit(EXIT_SUCCESS);
          return 0;
        },
        &loop);
  }
}

}  // namespace

Status monitor(const Report& report, bool inJSON) {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGPIPE);
  ::pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  EventLoop loop;
  endWith(loop, {SIGINT, SIGTERM});
  endWithOutput(loop);
  sd_bus* opened = nullptr;
  if (const int r = sd_bus_open_user(&opened); r < 0) {
    return fail({std::string(kErrorDomain), NoBus,
                 "the session bus cannot be reached: " + std::generic_category().message(-r)});
  }
  const BusRef bus(opened);
  Teller teller(inJSON);
  sd_bus_set_exit_on_disconnect(opened, 1);
  sd_bus_attach_event(opened, loop.event(), 0);
  sd_bus_match_signal(opened, nullptr, nullptr, names::kNotificationPath, names::kNotificationInterface,
                      names::kNotificationMember, handlePosted, &teller);
  const std::string owner =
      std::string("type='signal',sender='org.freedesktop.DBus',member='NameOwnerChanged',arg0='") +
      names::kAgent + "'";
  sd_bus_add_match(opened, nullptr, owner.c_str(), handleOwner, &teller);

  const auto log = LocalLog::fromEnvironment();
  const LocalState state;
  const std::string home = LocalState::homeDirectoryOfUser() + "/";
  Differences followUps(teller, "follow-up", [&] { return followUpLines(state, report); });
  Differences activities(teller, "activity", [&] { return activityLines(state); });
  Differences downloads(teller, "download", [&] { return downloadLines(state); });
  const FileWatch followUpWatch(loop, *log, home + names::followUpsFile(),
                                [&](std::size_t) { followUps.update(); });
  const FileWatch activityWatch(loop, *log, home + names::activitiesFile(),
                                [&](std::size_t) { activities.update(); });
  const FileWatch preferenceWatch(loop, *log, home + names::preferencesFile(), [&](std::size_t) {
    activities.update();
    downloads.update();
  });
  Result<AgentConnection> agent = AgentConnection::connect();
  if (!agent) return fail(agent.error());
  // Of follow-ups, their file tells more.
  const ChangesInLoop changes(loop, *std::move(agent), [&](const Change& change) {
    if (change.isBeginning) return;
    for (const auto& device : change.records) teller.tell("coverage", report.serial(device), "changed");
    if (change.devices) teller.tell("devices", "", "changed");
  });
  teller.tell("monitor", "", "watching");
  const int status = loop.run();
  sd_bus_detach_event(opened);
  if (status == EXIT_SUCCESS) return kFine;
  if (status == kOutputGone) return kFailed;
  return fail({std::string(kErrorDomain), NoBus, "the session bus has gone"});
}

}  // namespace kvr::client
