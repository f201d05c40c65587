#include "local/process/LocalActivityScheduler.h"

#include <sys/timerfd.h>
#include <systemd/sd-event.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <exception>
#include <fstream>
#include <system_error>
#include <utility>

namespace kvr {
namespace {

/// The most that rounding a date may shorten a wait by, in seconds.
constexpr double kMargin = 0.001;
/// Seconds; the kernel's own limit is not far above. A longer wait is split.
constexpr double kLongestWait = 1e8;

double secondsOf(clockid_t clock) {
  timespec now{};
  ::clock_gettime(clock, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

Descriptor wallClockTimer() {
  Descriptor timer(::timerfd_create(CLOCK_REALTIME, TFD_CLOEXEC | TFD_NONBLOCK));
  if (!timer) throw std::system_error(errno, std::generic_category(), "timerfd_create");
  return timer;
}

}  // namespace

LocalActivityScheduler::LocalActivityScheduler(EventLoop& loop, const DeviceRoot& root, const Clock& clock,
                                               WorkQueues& queues, Random& random,
                                               const DeviceProperties& device, Log& log,
                                               const std::string& mainBundleIdentifier,
                                               ActivityOccasions occasions, HostFiles host)
    : FileActivityScheduler(root.lists(), clock, queues, random, device, log, mainBundleIdentifier,
                            std::move(occasions)),
      host_(std::move(host)),
      timer_(wallClockTimer()),
      network_(
          loop, log, root, [this](bool reachable) { setNetworkReachable(reachable); }, host_.networkState) {
  const auto ended = [](sd_event_source*, int, std::uint32_t, void* self) {
    static_cast<LocalActivityScheduler*>(self)->timerEnded();
    return 0;
  };
  const int result = ::sd_event_add_io(loop.event(), &source_, timer_.get(), EPOLLIN, ended, this);
  if (result < 0) throw std::system_error(-result, std::generic_category(), "sd_event_add_io");
  setNetworkReachable(network_.isReachable());
}

LocalActivityScheduler::~LocalActivityScheduler() { ::sd_event_source_disable_unref(source_); }

double LocalActivityScheduler::uptime() const { return secondsOf(CLOCK_BOOTTIME); }

/// Empty when the kernel does not tell; then it never looks like another boot.
std::string LocalActivityScheduler::bootIdentifier() const {
  std::ifstream file(host_.bootIdentifier);
  std::string identifier;
  file >> identifier;
  return identifier;
}

void LocalActivityScheduler::arm(std::optional<double> wait) {
  itimerspec time{};
  if (wait) {
    const double end = secondsOf(CLOCK_REALTIME) + std::clamp(*wait, 0.0, kLongestWait) + kMargin;
    time.it_value.tv_sec = static_cast<time_t>(end);
    time.it_value.tv_nsec = static_cast<long>((end - std::floor(end)) * 1e9);
  }
  constexpr int kFlags = TFD_TIMER_ABSTIME | TFD_TIMER_CANCEL_ON_SET;
  if (::timerfd_settime(timer_.get(), kFlags, &time, nullptr) < 0 && errno == ECANCELED) {
    // The clock was set after the wait was computed: fire at once.
    time.it_value = {0, 1};
    ::timerfd_settime(timer_.get(), kFlags, &time, nullptr);
  }
}

void LocalActivityScheduler::timerEnded() noexcept {
  std::uint64_t count = 0;
  // A read error means that the clock was set, which is a reason to check as well.
  [[maybe_unused]] const auto size = ::read(timer_.get(), &count, sizeof count);
  try {
    startDue();
  } catch (const std::exception& error) {
    log().error("activities are not started: %@", std::string(error.what()));
  }
}

}  // namespace kvr
