#pragma once

#include "platform/WorkQueues.h"

#include <atomic>
#include <memory>
#include <mutex>
#include <vector>

struct sd_event;
struct sd_event_source;

namespace kvr {

/// One thread's event loop: what is posted from any thread, timers, and whatever is attached to `event()`.
///
/// Built, run and destroyed on one thread. With nothing posted and no timer due it does not wake up.
class EventLoop {
 public:
  EventLoop();
  ~EventLoop();
  EventLoop(const EventLoop&) = delete;
  EventLoop& operator=(const EventLoop&) = delete;

  /// For attaching sources; only on the loop's own thread.
  sd_event* event() const { return event_; }
  /// Runs `work` on the loop's thread, in the order posted. Any thread.
  void post(Work work);
  /// Runs `work` on the loop's thread after `delay` seconds of boot time (suspend included). Any thread.
  void after(double delay, Work work);
  /// Runs until `exit`; returns its status. What was posted and not run is released then.
  int run();
  /// Any thread.
  void exit(int status);

 private:
  void runPosted();

  sd_event* event_ = nullptr;
  sd_event_source* wakeSource_ = nullptr;
  int wakeDescriptor_ = -1;
  std::mutex mutex_;
  std::vector<Work> posted_;
  bool closed_ = false;
};

}  // namespace kvr
