#pragma once

#include <cstddef>
#include <functional>
#include <memory>

namespace kvr {

/// A flow of control with its own stack, on the thread that resumes it.
///
/// `resume` runs it until it pauses or its function returns. Destroy it only when it has finished. Use it on
/// one thread only.
class Fiber {
 public:
  /// `function` must not throw.
  explicit Fiber(std::function<void()> function);
  ~Fiber();
  Fiber(const Fiber&) = delete;
  Fiber& operator=(const Fiber&) = delete;

  /// Continues the fiber; returns when it pauses or has finished. Not from inside a fiber.
  void resume();
  /// Returns control to the caller of `resume`, until the next `resume`. Inside the fiber only.
  void pause();
  bool isFinished() const { return finished_; }

 private:
  struct Contexts;
  static void enter();
  [[noreturn]] void run();

  std::function<void()> function_;
  std::unique_ptr<Contexts> contexts_;
  bool finished_ = false;
};

}  // namespace kvr
