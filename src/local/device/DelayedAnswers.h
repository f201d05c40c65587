#pragma once

#include "platform/log/Log.h"

#include <chrono>
#include <condition_variable>
#include <functional>
#include <map>
#include <mutex>
#include <thread>

namespace kvr {

/// Answers that are given after a delay, on one thread of their own.
///
/// The thread starts with the first answer and sleeps until the next one is due. Answers due at the same time
/// are given in the order in which they were promised. An answer should be short: the others wait for it.
/// The end gives every answer that is still owed, as `ending`, and returns once all are given.
class DelayedAnswers {
 public:
  /// Called exactly once. `ending`: the time was not waited for, because these answers come to their end.
  using Answer = std::function<void(bool ending)>;

  explicit DelayedAnswers(Log& log) : log_(log) {}
  ~DelayedAnswers() { end(); }
  DelayedAnswers(const DelayedAnswers&) = delete;
  DelayedAnswers& operator=(const DelayedAnswers&) = delete;

  /// Gives `answer` after `delay` seconds. A negative or undefined delay is none; one of more than some
  /// thousand years lasts until the end. Any thread.
  void after(double delay, Answer answer);
  /// Later answers are given at once. Not on the thread of the answers.
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
