#include "local/loop/EventLoop.h"

#include <sys/eventfd.h>
#include <systemd/sd-event.h>
#include <time.h>
#include <unistd.h>

#include <cerrno>
#include <cmath>
#include <exception>
#include <limits>
#include <system_error>

namespace kvr {

namespace {

constexpr double kLongestDelay = 1e13;  // seconds; the loop's clock in microseconds overflows soon after
constexpr std::uint64_t kNever = std::numeric_limits<std::uint64_t>::max();
constexpr std::uint64_t kAccuracy = 1;  // microsecond; by default the loop would bundle timers within 250 ms

std::uint64_t bootTime() {
  timespec now{};
  ::clock_gettime(CLOCK_BOOTTIME, &now);
  return static_cast<std::uint64_t>(now.tv_sec) * 1'000'000 + static_cast<std::uint64_t>(now.tv_nsec) / 1'000;
}

std::uint64_t bootTimeAfter(double delay) {
  if (!(delay > 0)) return bootTime();
  if (delay > kLongestDelay) return kNever;
  return bootTime() + static_cast<std::uint64_t>(std::ceil(delay * 1e6));
}

void require(int result, const char* what) {
  if (result < 0) throw std::system_error(-result, std::generic_category(), what);
}

}  // namespace

EventLoop::EventLoop() {
  try {
    wakeDescriptor_ = ::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
    require(wakeDescriptor_ < 0 ? -errno : 0, "eventfd");
    require(::sd_event_new(&event_), "sd_event_new");
    const auto posted = [](sd_event_source*, int, std::uint32_t, void* self) {
      static_cast<EventLoop*>(self)->runPosted();
      return 0;
    };
    require(::sd_event_add_io(event_, &wakeSource_, wakeDescriptor_, EPOLLIN, posted, this),
            "sd_event_add_io");
    const auto due = [](sd_event_source*, std::uint64_t, void* self) {
      static_cast<EventLoop*>(self)->runDue();
      return 0;
    };
    require(::sd_event_add_time(event_, &timerSource_, CLOCK_BOOTTIME, kNever, kAccuracy, due, this),
            "sd_event_add_time");
    require(::sd_event_source_set_enabled(timerSource_, SD_EVENT_OFF), "sd_event_source_set_enabled");
  } catch (...) {
    close();
    throw;
  }
}

EventLoop::~EventLoop() { close(); }

void EventLoop::setFailureHandler(std::function<void(const std::string&)> handler) {
  failed_ = std::move(handler);
}

void EventLoop::post(Work work) {
  const std::lock_guard lock(mutex_);
  if (closed_) return;  // the caller's argument goes after the lock
  posted_.push_back(std::move(work));
  wake();
}

EventLoop::TimerKey EventLoop::after(double delay, Work work) {
  const std::lock_guard lock(mutex_);
  const TimerKey key{bootTimeAfter(delay), ++lastTimer_};
  if (closed_) return key;
  const auto added = timers_.emplace(key, std::move(work)).first;
  if (added == timers_.begin() && key.first != kNever) wake();
  return key;
}

void EventLoop::cancel(const TimerKey& key) {
  std::map<TimerKey, Work>::node_type cancelled;
  const std::lock_guard lock(mutex_);
  cancelled = timers_.extract(key);
}

std::size_t EventLoop::delayed() const {
  const std::lock_guard lock(mutex_);
  return timers_.size();
}

std::size_t EventLoop::pending() const {
  const std::lock_guard lock(mutex_);
  return posted_.size();
}

int EventLoop::run() {
  const int status = ::sd_event_loop(event_);
  releaseAll();
  require(exiting_ ? 0 : status, "sd_event_loop");
  return status;
}

void EventLoop::exit(int status) {
  post([this, status] {
    exiting_ = true;
    ::sd_event_exit(event_, status);
  });
}

/// With the mutex held.
void EventLoop::wake() {
  if (woken_) return;
  woken_ = true;
  ::eventfd_write(wakeDescriptor_, 1);
}

/// Work posted meanwhile runs after the loop's other sources had their turn.
void EventLoop::runPosted() {
  eventfd_t count = 0;
  ::eventfd_read(wakeDescriptor_, &count);
  std::unique_lock lock(mutex_);
  woken_ = false;
  for (std::size_t left = posted_.size(); left > 0 && !exiting_; --left) {
    Work work = std::move(posted_.front());
    posted_.pop_front();
    lock.unlock();
    runGuarded(work);
    lock.lock();
  }
  armTimer();
}

void EventLoop::runDue() {
  std::unique_lock lock(mutex_);
  const std::uint64_t now = bootTime();
  while (!timers_.empty() && timers_.begin()->first.first <= now && !exiting_) {
    auto due = timers_.extract(timers_.begin());
    lock.unlock();
    runGuarded(due.mapped());
    lock.lock();
  }
  armTimer();
}

/// Runs the work and destroys it.
void EventLoop::runGuarded(Work& work) noexcept {
  const auto failed = [this](const char* what) {
    if (!failed_) std::terminate();
    failed_(what);
  };
  try {
    work();
  } catch (const std::exception& error) {
    failed(error.what());
  } catch (...) {
    failed("unknown exception");
  }
  work = nullptr;
}

/// With the mutex held.
void EventLoop::armTimer() {
  if (timers_.empty() || timers_.begin()->first.first == kNever) {
    ::sd_event_source_set_enabled(timerSource_, SD_EVENT_OFF);
    return;
  }
  ::sd_event_source_set_time(timerSource_, timers_.begin()->first.first);
  ::sd_event_source_set_enabled(timerSource_, SD_EVENT_ONESHOT);
}

void EventLoop::releaseAll() {
  // Declared before the lock, so destroyed after it: destroying work may post more.
  std::deque<Work> posted;
  std::map<TimerKey, Work> timers;
  const std::lock_guard lock(mutex_);
  closed_ = true;
  posted.swap(posted_);
  timers.swap(timers_);
}

void EventLoop::close() {
  releaseAll();
  ::sd_event_source_unref(timerSource_);
  ::sd_event_source_unref(wakeSource_);
  ::sd_event_unref(event_);
  if (wakeDescriptor_ >= 0) ::close(wakeDescriptor_);
}

}  // namespace kvr
