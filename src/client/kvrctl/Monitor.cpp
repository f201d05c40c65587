#include "client/kvrctl/Monitor.h"

#include "platform/local/EventLoop.h"
#include "platform/local/FileWatch.h"
#include "platform/local/LocalLog.h"
#include "platform/local/bus/BusHandles.h"

#include <systemd/sd-event.h>

#include <array>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <map>

namespace kvr::client {
namespace {

constexpr const char* kAgent = "com.tarsil.kvragent";

void say(const std::string& what) {
  const std::time_t now = std::time(nullptr);
  std::tm local{};
  std::array<char, 32> text{};
  ::localtime_r(&now, &local);
  std::strftime(text.data(), text.size(), "%H:%M:%S", &local);
  std::printf("%s  %s\n", text.data(), printable(what).c_str());
  std::fflush(stdout);
}

/// Says what has come to, gone from or changed in a list of lines, each under a name.
class Differences {
 public:
  using Lines = std::map<std::string, std::string>;

  Differences(std::string what, Lines lines) : what_(std::move(what)), lines_(std::move(lines)) {}

  void update(Lines lines) {
    for (const auto& [name, line] : lines) {
      const auto before = lines_.find(name);
      if (before == lines_.end()) say(named(name).append(": ").append(line));
      if (before != lines_.end() && before->second != line)
        say(named(name).append(" changed: ").append(line));
    }
    for (const auto& [name, line] : lines_) {
      if (!lines.contains(name)) say(named(name).append(" is gone"));
    }
    lines_ = std::move(lines);
  }

 private:
  std::string named(const std::string& name) const { return what_ + " " + name; }

  const std::string what_;
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
  for (const auto& activity : *activities) {
    lines[activity.identifier] =
        "not before " + describe(activity.targetDate) + ", due " + describe(activity.dueDate);
  }
  return lines;
}

int handlePosted(sd_bus_message* message, void*, sd_bus_error*) {
  return guardedBusCallback([&] {
    const char* name = nullptr;
    if (sd_bus_message_read(message, "s", &name) >= 0) say(std::string("notification ") + name);
    return 0;
  });
}

int handleOwner(sd_bus_message* message, void*, sd_bus_error*) {
  const char* name = nullptr;
  const char* before = nullptr;
  const char* now = nullptr;
  if (sd_bus_message_read(message, "sss", &name, &before, &now) >= 0 && std::string_view(name) == kAgent) {
    say(*now != '\0' ? "the agent has started" : "the agent has ended");
  }
  return 0;
}

}  // namespace

int monitor(const Report& report) {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGINT);
  sigaddset(&signals, SIGTERM);
  ::pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  EventLoop loop;
  for (const int signal : {SIGINT, SIGTERM}) {
    sd_event_add_signal(
        loop.event(), nullptr, signal,
        [](sd_event_source*, const signalfd_siginfo*, void* it) {
          static_cast<EventLoop*>(it)->exit(EXIT_SUCCESS);
          return 0;
        },
        &loop);
  }
  sd_bus* opened = nullptr;
  if (const int r = sd_bus_open_user(&opened); r < 0) {
    std::fprintf(stderr, "kvrctl: the session bus cannot be reached: %s\n",
                 std::generic_category().message(-r).c_str());
    return 3;
  }
  const BusRef bus(opened);
  sd_bus_set_exit_on_disconnect(opened, 1);
  sd_bus_attach_event(opened, loop.event(), 0);
  sd_bus_match_signal(opened, nullptr, nullptr, "/com/tarsil/NotificationCenter",
                      "com.tarsil.NotificationCenter", "Posted", handlePosted, nullptr);
  sd_bus_match_signal(opened, nullptr, "org.freedesktop.DBus", nullptr, "org.freedesktop.DBus",
                      "NameOwnerChanged", handleOwner, nullptr);

  const auto log = LocalLog::fromEnvironment();
  const LocalState state;
  const std::string library = LocalState::homeDirectoryOfUser() + "/Library/";
  Differences followUps("follow-up", followUpLines(state, report));
  Differences activities("activity", activityLines(state));
  const FileWatch followUpWatch(loop, *log, library + "FollowUps/com.tarsil.Kavrel.plist",
                                [&] { followUps.update(followUpLines(state, report)); });
  const FileWatch activityWatch(loop, *log, library + "Activities/com.tarsil.kvragent.plist",
                                [&] { activities.update(activityLines(state)); });
  say("watching");
  const int status = loop.run();
  sd_bus_detach_event(opened);
  return status;
}

}  // namespace kvr::client
