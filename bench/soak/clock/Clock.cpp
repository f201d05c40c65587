// Loaded before the C library (LD_PRELOAD): the program's wall clock is ahead of the real one by the seconds
// in the file that KVR_CLOCK names, an 8-byte integer. When somebody writes the file, timers of the wall
// clock end at once, as they do when the clock is set. File times and all other clocks stay as they are.

#include <dlfcn.h>
#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <ctime>
#include <thread>

namespace {

/// Timers of the wall clock, by descriptor. None of the programs closes one before it ends.
std::array<std::atomic<bool>, 1024> timers{};

const char* fileName() { return std::getenv("KVR_CLOCK"); }

std::int64_t shift() {
  static const volatile std::int64_t* const shared = []() -> const volatile std::int64_t* {
    const char* const name = fileName();
    const int file = name == nullptr ? -1 : ::open(name, O_RDONLY | O_CLOEXEC);
    if (file < 0) return nullptr;
    void* const memory = ::mmap(nullptr, sizeof(std::int64_t), PROT_READ, MAP_SHARED, file, 0);
    ::close(file);
    return memory == MAP_FAILED ? nullptr : static_cast<const volatile std::int64_t*>(memory);
  }
  ();
  return shared == nullptr ? 0 : *shared;
}

template <class Function>
Function* next(const char* name) {
  return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

int setTimer(int timer, int flags, const itimerspec* value, itimerspec* old) {
  static auto* const real = next<int(int, int, const itimerspec*, itimerspec*)>("timerfd_settime");
  return real(timer, flags, value, old);
}

bool isWallTimer(int timer) {
  return timer >= 0 && static_cast<std::size_t>(timer) < timers.size() &&
         timers[static_cast<std::size_t>(timer)];
}

[[noreturn]] void endTimersWhenTheClockIsSet(int watch) {
  while (true) {
    std::array<char, 4096> events{};
    if (::read(watch, events.data(), events.size()) <= 0) ::pause();
    for (int timer = 0; timer < static_cast<int>(timers.size()); ++timer) {
      const itimerspec atOnce{{}, {0, 1}};
      if (isWallTimer(timer)) setTimer(timer, 0, &atOnce, nullptr);
    }
  }
}

void watchTheClock() {
  const char* const name = fileName();
  const int watch = name == nullptr ? -1 : ::inotify_init1(IN_CLOEXEC);
  if (watch < 0 || ::inotify_add_watch(watch, name, IN_CLOSE_WRITE) < 0) return;
  sigset_t all;
  sigset_t before;
  ::sigfillset(&all);
  ::pthread_sigmask(SIG_SETMASK, &all, &before);
  std::thread(endTimersWhenTheClockIsSet, watch).detach();
  ::pthread_sigmask(SIG_SETMASK, &before, nullptr);
}

}  // namespace

extern "C" {

int clock_gettime(clockid_t clock, timespec* time) noexcept {
  static auto* const real = next<int(clockid_t, timespec*)>("clock_gettime");
  const int result = real(clock, time);
  if (result == 0 && clock == CLOCK_REALTIME) time->tv_sec += shift();
  return result;
}

int gettimeofday(timeval* time, void*) noexcept {
  timespec now{};
  clock_gettime(CLOCK_REALTIME, &now);
  *time = {now.tv_sec, now.tv_nsec / 1000};
  return 0;
}

std::time_t time(std::time_t* result) noexcept {
  timespec now{};
  clock_gettime(CLOCK_REALTIME, &now);
  if (result != nullptr) *result = now.tv_sec;
  return now.tv_sec;
}

int timerfd_create(clockid_t clock, int flags) noexcept {
  const auto timer = static_cast<int>(::syscall(SYS_timerfd_create, clock, flags));
  if (clock != CLOCK_REALTIME || timer < 0 || static_cast<std::size_t>(timer) >= timers.size()) return timer;
  static const bool isWatched = [] {
    watchTheClock();
    return true;
  }();
  timers[static_cast<std::size_t>(timer)] = isWatched;
  return timer;
}

int timerfd_settime(int timer, int flags, const itimerspec* value, itimerspec* old) noexcept {
  itimerspec real = *value;
  const bool isSet = real.it_value.tv_sec != 0 || real.it_value.tv_nsec != 0;
  if (isSet && (flags & TFD_TIMER_ABSTIME) != 0 && isWallTimer(timer)) real.it_value.tv_sec -= shift();
  return setTimer(timer, flags, &real, old);
}

}  // extern "C"
