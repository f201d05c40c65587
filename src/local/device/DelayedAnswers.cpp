#include "local/device/DelayedAnswers.h"

#include "local/system/Deadline.h"

#include <exception>
#include <system_error>
#include <utility>

namespace kvr {
void DelayedAnswers::end() {
  std::thread thread;
  {
    const std::lock_guard lock(mutex_);
    ending_ = true;
    thread.swap(thread_);
  }
  changed_.notify_one();
  if (thread.joinable()) thread.join();
}

void DelayedAnswers::after(double delay, Answer answer) {
  const auto time = deadlineAfter(delay);
  std::unique_lock lock(mutex_);
  if (ending_) {
    lock.unlock();
    return give(answer, true);
  }
  if (!thread_.joinable()) {
    try {
      thread_ = std::thread([this] { run(); });
    } catch (const std::system_error& error) {
      lock.unlock();
      log_.error("no thread for delayed answers: %s", error.what());
      give(answer, true);
      return;
    }
  }
  owed_.emplace(time, std::move(answer));
  lock.unlock();
  changed_.notify_one();
}

void DelayedAnswers::run() {
  std::unique_lock lock(mutex_);
  while (true) {
    if (owed_.empty()) {
      if (ending_) return;
      changed_.wait(lock);
      continue;
    }
    const auto due = owed_.begin()->first;
    if (!ending_ && due > std::chrono::steady_clock::now()) {
      changed_.wait_until(lock, due);
      continue;
    }
    // Destroy an answer, and what it captures, before waiting for the next one.
    auto node = owed_.extract(owed_.begin());
    const bool ending = ending_;
    lock.unlock();
    give(node.mapped(), ending);
    node = {};
    lock.lock();
  }
}

void DelayedAnswers::give(const Answer& answer, bool ending) {
  try {
    answer(ending);
  } catch (const std::exception& error) {
    log_.error("a delayed answer failed: %s", error.what());
  }
}

}  // namespace kvr
