#pragma once

#include "platform/log/Log.h"

#include <chrono>
#include <condition_variable>
#include <functional>
#include <map>
#include <mutex>
#include <thread>

namespace kvr {

/// Gives answers after a delay, on one thread of its own.
///
/// The thread starts with the first answer and sleeps until the next one is due. Answers due at the same time
/// are given in the order in which they were added. An answer should be short, because the others wait for
/// it. `end` gives every outstanding answer at once, with `ending` set, and returns once all are given.
class DelayedAnswers {
 public:
  /// Called exactly once. `ending`: the delay was cut short, because the object is ending.
  using Answer = std::function<void(bool ending)>;

  explicit DelayedAnswers(Log& log) : log_(log) {}
  ~DelayedAnswers() { end(); }
  DelayedAnswers(const DelayedAnswers&) = delete;
  DelayedAnswers& operator=(const DelayedAnswers&) = delete;

  /// Gives `answer` after `delay` seconds. A negative delay or NaN counts as 0; a delay of more than a few
  /// thousand years lasts until the end. Any thread.
  void after(double delay, Answer answer);
  /// Later answers are given at once. Not on the thread that gives the answers.
  void end();

 private:
  using Time = std::chrono::steady_clock::time_point;

  void run();
  void give(const Answer& answer, bool ending);

  Log& log_;
  std::mutex mutex_;  ///< guards what follows
  std::condition_variable changed_;
  std::multimap<Time, Answer> owed_;
  bool ending_ = false;
  std::thread thread_;
};

}  // namespace kvr
