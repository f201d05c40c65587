// kvragent-wake: takes the place of an agent that has exited cleanly on a bus without a service manager,
// until the next agent is needed.
//
// The agent starts it before it releases its name. It writes one byte to its standard output once it is
// watching. Its standard input is closed when the agent ends; from then on it acts: it has the bus start the
// next agent when an activity is due or when a notification was posted. Once there is an agent, it posts
// again what it has heard, and exits.

#include "local/bus/BusConnection.h"
#include "local/buscodec/BusHandles.h"
#include "local/loop/LocalWorkQueues.h"
#include "local/process/LocalChanges.h"
#include "local/system/LocalClock.h"
#include "local/system/LocalFiles.h"
#include "local/system/LocalLog.h"
#include "platform/names/Names.h"

#include <sys/epoll.h>
#include <systemd/sd-event.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <string_view>
#include <vector>

namespace kvr {
namespace {

constexpr const char* kBus = "org.freedesktop.DBus";
constexpr const char* kBusPath = "/org/freedesktop/DBus";
constexpr double kLongestWait = 86400;  // seconds; the clock may be set, so check it at least this often
constexpr double kRetry = 60;           // seconds until the next try after a failed start

class Waker {
 public:
  int run() {
    for (const auto* name : {names::kLanguageChanged, names::kDeviceDidPair, names::kDeviceDidUnpair}) {
      notifications_.registerFor(name, [this, name] {
        const auto before = static_cast<std::size_t>(std::ranges::count(heard_, name));
        if (before < LocalNotifications::kMostInARow) heard_.emplace_back(name);
        look();
      });
    }
    bus_.thread()->post([this] { watchForAgent(); });
    const auto agentEnded = [](sd_event_source* source, int, std::uint32_t, void* self) {
      sd_event_source_set_enabled(source, SD_EVENT_OFF);
      static_cast<Waker*>(self)->loop_.post([self] { static_cast<Waker*>(self)->beginActing(); });
      return 0;
    };
    sd_event_add_io(loop_.event(), nullptr, STDIN_FILENO, EPOLLIN | EPOLLHUP, agentEnded, this);
    const int status = loop_.run();
    notifications_.beginEnding();
    queues_.beginEnding();
    queues_.drain(1);
    return status;
  }

 private:
  /// On the bus thread: watches for the next agent and reports that it is watching.
  void watchForAgent() {
    sd_bus* const bus = bus_.bus();
    sd_bus_slot* slot = nullptr;
    const auto changed = [](sd_bus_message* message, void* context, sd_bus_error*) {
      return guardedBusCallback([&] {
        const char* name = nullptr;
        const char* before = nullptr;
        const char* now = nullptr;
        if (sd_bus_message_read(message, "sss", &name, &before, &now) >= 0 &&
            std::string_view(name) == names::kAgent && *now != '\0') {
          auto* const self = static_cast<Waker*>(context);
          self->loop_.post([self] { self->passOn(); });
        }
        return 0;
      });
    };
    if (bus == nullptr ||
        sd_bus_match_signal(bus, &slot, kBus, kBusPath, kBus, "NameOwnerChanged", changed, this) < 0) {
      return loop_.exit(EXIT_FAILURE);
    }
    ownerWatch_.reset(slot);
    if (::write(STDOUT_FILENO, "+", 1) != 1) loop_.exit(EXIT_FAILURE);
  }

  void beginActing() {
    isActing_ = true;
    look();
  }

  /// When the next activity is due, according to the agent's file.
  std::optional<Date> dueDate() {
    const auto tree =
        lists_.read(files_.homeDirectory() + "/" + names::activitiesFile(),
                    PropertyListFiles::Expected::Dictionary, PropertyListFiles::WhenDamaged::Leave);
    std::optional<Date> due;
    if (!tree || !(*tree)["activities"].isDictionary()) return due;
    for (const auto& [identifier, activity] : (*tree)["activities"].dictionary()) {
      const auto date = activity["dueDate"].dateIfAny();
      if (date && (!due || *date < *due)) due = date;
    }
    return due;
  }

  void look() {
    if (!isActing_ || isStarting_) return;
    const auto due = dueDate();
    const double wait = due ? *due - clock_.now() : kLongestWait;
    if (!heard_.empty() || wait <= 0) return start();
    loop_.after(std::min(wait, kLongestWait), [this] { look(); });
  }

  /// Once it has succeeded, the name has an owner, and the bus says so.
  void start() {
    isStarting_ = true;
    bus_.thread()->post([this] {
      sd_bus* const bus = bus_.bus();
      const bool isStarted =
          bus != nullptr && sd_bus_call_method(bus, kBus, kBusPath, kBus, "StartServiceByName", nullptr,
                                               nullptr, "su", names::kAgent, 0U) >= 0;
      if (!isStarted) loop_.post([this] { tryAgainLater(); });
    });
  }

  void tryAgainLater() {
    isStarting_ = false;
    loop_.after(kRetry, [this] { look(); });
  }

  /// The next agent has the name; before that, it has subscribed to notifications. The bus reports this after
  /// every notification that the agent may have missed, so all of them have been heard.
  void passOn() {
    for (const auto name : heard_) notifications_.post(std::string(name));
    heard_.clear();
    bus_.thread()->post([this] { loop_.exit(EXIT_SUCCESS); });
  }

  bool isActing_ = false;                ///< the agent has ended
  bool isStarting_ = false;              ///< the next agent is being started, or has been
  std::vector<std::string_view> heard_;  ///< in order; of each name at most `kMostInARow`
  EventLoop loop_;
  const std::unique_ptr<LocalLog> log_ = LocalLog::fromEnvironment();
  LocalClock clock_;
  LocalFiles files_{*log_};
  PropertyListFiles lists_{files_, clock_, *log_};
  DeviceRoot root_{lists_, *log_};
  LocalUserLocale locale_{root_, *log_};
  LocalPairedDeviceRegistry pairedDevices_{root_};
  LocalWorkQueues queues_{loop_, *log_};
  BusSlotRef ownerWatch_;  ///< used on the bus thread
  BusConnection bus_{*log_, [this](const Error&) { loop_.exit(EXIT_SUCCESS); }};
  LocalNotifications notifications_{bus_, queues_, *log_};
  LocalChanges changes_{loop_, *log_, root_, locale_, pairedDevices_, notifications_};
};

}  // namespace
}  // namespace kvr

int main() {
  std::signal(SIGPIPE, SIG_IGN);
  try {
    return kvr::Waker().run();
  } catch (const std::exception& error) {
    std::fprintf(stderr, "kvragent-wake: %s\n", error.what());
    return EXIT_FAILURE;
  }
}
