#pragma once

#include "platform/services/WorkQueues.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <utility>

struct sd_event;
struct sd_event_source;

namespace kvr {

/// The event loop of one thread: runs posted work, timers and whatever is attached to `event()`.
///
/// Built, run and destroyed on one thread. It sleeps while nothing is posted and no timer is due. An
/// exception that leaves a piece of work ends only that piece and goes to the failure handler.
class EventLoop {
 public:
  /// Identifies one delayed piece of work: the boot time in microseconds when it is due, and a unique number.
  using TimerKey = std::pair<std::uint64_t, std::uint64_t>;

  EventLoop();
  ~EventLoop();
  EventLoop(const EventLoop&) = delete;
  EventLoop& operator=(const EventLoop&) = delete;

  /// For attaching event sources; only on the loop's own thread.
  sd_event* event() const { return event_; }
  /// Called with the text of an exception that left a piece of work. Without a handler the process
  /// terminates. Only on the loop's own thread.
  void setFailureHandler(std::function<void(const std::string& what)> handler);
  /// Runs `work` on the loop's thread, in the order posted. Any thread.
  void post(Work work);
  /// Runs `work` on the loop's thread after `delay` seconds of boot time (time in suspend counts). A delay of
  /// more than 10^13 seconds never ends. Any thread.
  TimerKey after(double delay, Work work);
  /// Drops delayed work that has not begun; no effect otherwise. Any thread.
  void cancel(const TimerKey& key);
  /// Number of delayed pieces of work that have not begun. Any thread.
  std::size_t delayed() const;
  /// Number of posted pieces of work that have not begun. Any thread.
  std::size_t pending() const;
  /// Runs until `exit` and returns its status. Posted or delayed work that has not run is dropped then, and
  /// later work is dropped at once. Throws std::system_error when the kernel refuses.
  int run();
  /// Ends `run` once everything posted before has run. Any thread.
  void exit(int status);

 private:
  void wake();
  void runPosted();
  void runDue();
  void runGuarded(Work& work) noexcept;
  void armTimer();
  void releaseAll();
  void close();

  sd_event* event_ = nullptr;
  sd_event_source* wakeSource_ = nullptr;
  sd_event_source* timerSource_ = nullptr;
  int wakeDescriptor_ = -1;
  bool exiting_ = false;
  std::function<void(const std::string&)> failed_;

  mutable std::mutex mutex_;  ///< guards what follows
  std::deque<Work> posted_;
  std::map<TimerKey, Work> timers_;
  std::uint64_t lastTimer_ = 0;
  bool woken_ = false;
  bool closed_ = false;
};

}  // namespace kvr
