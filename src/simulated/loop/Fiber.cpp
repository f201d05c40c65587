#include "simulated/loop/Fiber.h"

#include <cxxabi.h>
#include <sys/mman.h>
#include <ucontext.h>

#include <array>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <new>
#include <utility>

#if defined(__has_feature)
#if __has_feature(address_sanitizer)
#define KVR_FIBER_ASAN
#endif
#if __has_feature(thread_sanitizer)
#define KVR_FIBER_TSAN
#endif
#endif
#if defined(__SANITIZE_ADDRESS__)
#define KVR_FIBER_ASAN
#endif
#if defined(__SANITIZE_THREAD__)
#define KVR_FIBER_TSAN
#endif

#ifdef KVR_FIBER_ASAN
#include <sanitizer/common_interface_defs.h>
#endif
#ifdef KVR_FIBER_TSAN
#include <sanitizer/tsan_interface.h>
#endif

namespace kvr {

namespace {

constexpr std::size_t kStackSize = std::size_t{2} << 20;  // committed as it is used
constexpr std::size_t kGuardSize = 4096;

/// The fiber resumed last; read by its entry function.
thread_local Fiber* resumed = nullptr;

/// The C++ runtime counts the exceptions being handled per thread; each fiber needs its own count.
class HandledExceptions {
 public:
  void swapWithThread() {
    std::array<unsigned char, 2 * sizeof(void*)> current{};
    void* const globals = abi::__cxa_get_globals();
    std::memcpy(current.data(), globals, current.size());
    std::memcpy(globals, state_.data(), state_.size());
    state_ = current;
  }

 private:
  std::array<unsigned char, 2 * sizeof(void*)> state_{};
};

}  // namespace

struct Fiber::Contexts {
  char* stack;
  ucontext_t own{};
  ucontext_t resumer{};
  HandledExceptions exceptions;
#ifdef KVR_FIBER_ASAN
  void* ownFakeStack = nullptr;
  void* resumerFakeStack = nullptr;
  const void* resumerStack = nullptr;
  std::size_t resumerStackSize = 0;
#endif
#ifdef KVR_FIBER_TSAN
  void* ownState = __tsan_create_fiber(0);
  void* resumerState = nullptr;
#endif

  Contexts() {
    void* const memory = ::mmap(nullptr, kGuardSize + kStackSize, PROT_READ | PROT_WRITE,
                                MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
    if (memory == MAP_FAILED) throw std::bad_alloc();
    ::mprotect(memory, kGuardSize, PROT_NONE);
    stack = static_cast<char*>(memory);
  }
  ~Contexts() {
    ::munmap(stack, kGuardSize + kStackSize);
#ifdef KVR_FIBER_TSAN
    __tsan_destroy_fiber(ownState);
#endif
  }
  Contexts(const Contexts&) = delete;
  Contexts& operator=(const Contexts&) = delete;

  void switchToOwn() {
    exceptions.swapWithThread();
#ifdef KVR_FIBER_TSAN
    resumerState = __tsan_get_current_fiber();
    __tsan_switch_to_fiber(ownState, 0);
#endif
#ifdef KVR_FIBER_ASAN
    __sanitizer_start_switch_fiber(&resumerFakeStack, stack + kGuardSize, kStackSize);
#endif
    ::swapcontext(&resumer, &own);
#ifdef KVR_FIBER_ASAN
    __sanitizer_finish_switch_fiber(resumerFakeStack, nullptr, nullptr);
#endif
    exceptions.swapWithThread();
  }

  void switchToResumer([[maybe_unused]] bool forGood) {
#ifdef KVR_FIBER_TSAN
    __tsan_switch_to_fiber(resumerState, 0);
#endif
#ifdef KVR_FIBER_ASAN
    __sanitizer_start_switch_fiber(forGood ? nullptr : &ownFakeStack, resumerStack, resumerStackSize);
#endif
    ::swapcontext(&own, &resumer);
    arrived();
  }

  /// Call this first on the fiber's own stack.
  void arrived() {
#ifdef KVR_FIBER_ASAN
    __sanitizer_finish_switch_fiber(ownFakeStack, &resumerStack, &resumerStackSize);
#endif
  }
};

Fiber::Fiber(std::function<void()> function)
    : function_(std::move(function)), contexts_(std::make_unique<Contexts>()) {
  ::getcontext(&contexts_->own);
  contexts_->own.uc_stack.ss_sp = contexts_->stack + kGuardSize;
  contexts_->own.uc_stack.ss_size = kStackSize;
  contexts_->own.uc_link = nullptr;
  ::makecontext(&contexts_->own, &Fiber::enter, 0);
  // The sanitizer would otherwise clear the memory of this whole stack at every switch.
  contexts_->own.uc_stack = {};
}

Fiber::~Fiber() = default;

void Fiber::resume() {
  resumed = this;
  contexts_->switchToOwn();
}

void Fiber::pause() { contexts_->switchToResumer(false); }

void Fiber::enter() { resumed->run(); }

void Fiber::run() {
  contexts_->arrived();
  function_();
  finished_ = true;
  contexts_->switchToResumer(true);
  std::abort();  // a finished fiber is never resumed
}

}  // namespace kvr
