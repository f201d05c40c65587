#pragma once

#include "platform/local/EventLoop.h"
#include "platform/local/LocalWorkQueues.h"
#include "platform/simulated/SimulatedLog.h"
#include "platform/simulated/SimulatedWorkQueues.h"

#include <algorithm>
#include <functional>
#include <future>
#include <memory>
#include <string>
#include <thread>
#include <vector>

namespace kvr {

/// Work queues of either kind. Waiting for a signal on the test's own thread lets the work go on: the local
/// ones by themselves, the simulated ones inside that wait.
class QueuesWorld {
 public:
  virtual ~QueuesWorld() = default;
  virtual WorkQueues& queues() = 0;
  virtual void beginEnding() = 0;
  /// What is said of work items that failed.
  virtual std::vector<std::string> failures() const = 0;
};

/// The main event loop has a thread of its own here, so that the test's thread may wait.
class LocalQueuesWorld : public QueuesWorld {
 public:
  LocalQueuesWorld() {
    std::promise<void> ready;
    thread_ = std::thread([this, &ready] {
      EventLoop loop;
      LocalWorkQueues queues(loop, log_);
      loop_ = &loop;
      queues_ = &queues;
      ready.set_value();
      loop.run();
    });
    ready.get_future().wait();
  }
  ~LocalQueuesWorld() override {
    loop_->exit(0);
    thread_.join();
  }
  LocalQueuesWorld(const LocalQueuesWorld&) = delete;
  LocalQueuesWorld& operator=(const LocalQueuesWorld&) = delete;

  LocalWorkQueues& queues() override { return *queues_; }
  void beginEnding() override { queues_->beginEnding(); }
  std::vector<std::string> failures() const override { return log_.texts(LogLevel::Error); }

 private:
  SimulatedLog log_;
  EventLoop* loop_ = nullptr;
  LocalWorkQueues* queues_ = nullptr;
  std::thread thread_;
};

class SimulatedQueuesWorld : public QueuesWorld {
 public:
  SimulatedWorkQueues& queues() override { return queues_; }
  void beginEnding() override { queues_.beginEnding(); }
  std::vector<std::string> failures() const override { return queues_.faults(); }

 private:
  SimulatedClock clock_;
  SimulatedWorkQueues queues_{clock_, 1};
};

}  // namespace kvr
