// kvragent-wake: stands in for an agent that has ended cleanly on a bus without a service manager, until
// there is something to do for it. Argument: the date of the next activity in seconds since 1970, or "never".
// Closes its standard output once it is watching.

#include "platform/local/BusConnection.h"
#include "platform/local/LocalChanges.h"
#include "platform/local/LocalClock.h"
#include "platform/local/LocalFiles.h"
#include "platform/local/LocalLog.h"
#include "platform/local/LocalWorkQueues.h"
#include "platform/local/bus/BusHandles.h"

#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <string_view>

namespace kvr {
namespace {

constexpr const char* kName = "com.tarsil.kvragent";
constexpr const char* kBus = "org.freedesktop.DBus";
constexpr const char* kBusPath = "/org/freedesktop/DBus";
constexpr double kNever = 1e15;         // seconds
constexpr double kLongestWait = 86400;  // seconds; between two looks at a clock that may have been set

/// Has the agent started when a date has come or a notification is posted, and leaves as soon as there is
/// one.
class Waker {
 public:
  explicit Waker(Date due) : due_(due) {}

  int run() {
    for (const auto* name : {UserLocale::kLanguageChanged, PairedDeviceRegistry::kDeviceDidPair,
                             PairedDeviceRegistry::kDeviceDidUnpair}) {
      notifications_.registerFor(name, [this, name] { wake(name); });
    }
    bus_.thread()->post([this] { watchForAgent(); });
    waitForDate();
    const int status = loop_.run();
    notifications_.beginEnding();
    queues_.beginEnding();
    queues_.drain(1);
    return status;
  }

 private:
  void waitForDate() {
    const double wait = due_ - clock_.now();
    if (wait <= 0) return wake(nullptr);
    loop_.after(std::min(wait, kLongestWait), [this] { waitForDate(); });
  }

  /// The notification is posted once more, to the agent that could not hear it.
  void wake(const char* notification) {
    if (std::exchange(isWaking_, true)) return;
    bus_.thread()->post([this, notification] {
      sd_bus* const bus = bus_.bus();
      if (bus == nullptr) return;
      sd_bus_call_method(bus, kBus, kBusPath, kBus, "StartServiceByName", nullptr, nullptr, "su", kName, 0U);
      if (notification != nullptr) notifications_.post(notification);
      bus_.thread()->post([this] { loop_.exit(EXIT_SUCCESS); });
    });
  }

  /// On the bus thread.
  void watchForAgent() {
    sd_bus* const bus = bus_.bus();
    if (bus == nullptr) return;
    sd_bus_slot* slot = nullptr;
    const auto owned = [](sd_bus_message* message, void* self, sd_bus_error*) {
      const char* name = nullptr;
      const char* before = nullptr;
      const char* now = nullptr;
      if (sd_bus_message_read(message, "sss", &name, &before, &now) >= 0 && std::string_view(name) == kName &&
          *now != '\0') {
        static_cast<Waker*>(self)->loop_.exit(EXIT_SUCCESS);
      }
      return 0;
    };
    if (sd_bus_match_signal(bus, &slot, kBus, kBusPath, kBus, "NameOwnerChanged", owned, this) >= 0) {
      sd_bus_slot_set_floating(slot, 1);
      sd_bus_slot_unref(slot);
    }
    // From here on nothing is missed, which lets the agent go.
    ::close(STDOUT_FILENO);
  }

  const Date due_;
  bool isWaking_ = false;
  EventLoop loop_;
  const std::unique_ptr<LocalLog> log_ = LocalLog::fromEnvironment();
  LocalClock clock_;
  LocalFiles files_{*log_};
  PropertyListFiles lists_{files_, clock_, *log_};
  DeviceRoot root_{lists_, *log_};
  LocalUserLocale locale_{root_, *log_};
  LocalPairedDeviceRegistry pairedDevices_{root_};
  LocalWorkQueues queues_{loop_, *log_};
  BusConnection bus_{*log_, [this](const Error&) { loop_.exit(EXIT_SUCCESS); }};
  LocalNotifications notifications_{bus_, queues_, *log_};
  LocalChanges changes_{loop_, *log_, root_, locale_, pairedDevices_, notifications_};
};

}  // namespace
}  // namespace kvr

int main(int argumentCount, char** arguments) {
  std::signal(SIGPIPE, SIG_IGN);
  const double due = argumentCount > 1 ? std::strtod(arguments[1], nullptr) : 0;
  try {
    return kvr::Waker(kvr::Date{due > 0 ? due : kvr::kNever}).run();
  } catch (const std::exception& error) {
    std::fprintf(stderr, "kvragent-wake: %s\n", error.what());
    return EXIT_FAILURE;
  }
}
