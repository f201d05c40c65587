#pragma once

#include <cstddef>
#include <functional>
#include <memory>

namespace kvr {

/// A flow of control with a stack of its own, on the thread that resumes it.
///
/// `resume` runs it until it pauses or its function returns. It may be destroyed only when it has finished.
/// All of it belongs to one thread.
class Fiber {
 public:
  /// `function` must not throw.
  explicit Fiber(std::function<void()> function);
  ~Fiber();
  Fiber(const Fiber&) = delete;
  Fiber& operator=(const Fiber&) = delete;

  /// Goes on in the fiber; returns when it pauses or has finished. Not from inside a fiber.
  void resume();
  /// Gives control back to whoever resumed the fiber, until the next `resume`. Inside the fiber only.
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
