// Loaded before the C library (LD_PRELOAD): kills the program at one call on files, or makes calls fail, as
// set in the page that it shares with the test. Stops the wall clock at the second in KVR_CLOCK.
#include "integration/support/Injection.h"

#include <dlfcn.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstdlib>
#include <ctime>
#include <string_view>

namespace {

using kvr::testing::Injection;

/// The kind of each open descriptor.
enum class Opened : unsigned char { Elsewhere, File, Directory };
std::array<std::atomic<Opened>, 1024> opened{};

Injection* page() {
  static Injection* const shared = [] {
    const char* const name = std::getenv(Injection::kVariable);
    const long file = name == nullptr ? -1 : ::syscall(SYS_openat, AT_FDCWD, name, O_RDWR | O_CLOEXEC);
    void* const memory = file < 0 ? MAP_FAILED
                                  : ::mmap(nullptr, sizeof(Injection), PROT_READ | PROT_WRITE, MAP_SHARED,
                                           static_cast<int>(file), 0);
    return memory == MAP_FAILED ? nullptr : static_cast<Injection*>(memory);
  }();
  return shared;
}

bool counts(std::string_view path) {
  const auto* const shared = page();
  if (shared == nullptr || shared->path[0] == '\0' || !path.starts_with(shared->path)) return false;
  const auto rest = path.substr(std::string_view(shared->path).size());
  return rest.empty() || rest.front() == '/';
}

Opened kindOf(int descriptor) {
  return descriptor >= 0 && static_cast<std::size_t>(descriptor) < opened.size()
             ? opened[static_cast<std::size_t>(descriptor)].load()
             : Opened::Elsewhere;
}

void note(long descriptor, Opened kind) {
  if (descriptor >= 0 && static_cast<std::size_t>(descriptor) < opened.size()) {
    opened[static_cast<std::size_t>(descriptor)] = kind;
  }
}

/// Counts a call; returns whether it must fail. If the program must be killed here, runs `atTheEnd` first.
template <class Do = void (*)()>
bool fails(const Do& atTheEnd = [] {}) {
  auto& shared = *page();
  const auto number = ++shared.calls;
  if (shared.first == 0 || number < shared.first || number > shared.last) return false;
  if (shared.error == Injection::kKill) {
    atTheEnd();
    ::kill(::getpid(), SIGKILL);
    ::pause();
  }
  errno = shared.error;
  return true;
}

bool failsFor(const char* path) { return counts(path) && fails(); }

template <class Function>
Function* next(const char* name) {
  return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

}  // namespace

extern "C" {

int open(const char* path, int flags, ...) {
  mode_t mode = 0;
  if ((flags & O_CREAT) != 0) {
    std::va_list more;
    va_start(more, flags);
    mode = va_arg(more, mode_t);
    va_end(more);
  }
  const bool isOurs = counts(path);
  if (isOurs && fails()) return -1;
  const long descriptor = ::syscall(SYS_openat, AT_FDCWD, path, flags, mode);
  if (isOurs) note(descriptor, (flags & O_DIRECTORY) != 0 ? Opened::Directory : Opened::File);
  return static_cast<int>(descriptor);
}

int mkostemp(char* path, int flags) {
  static auto* const real = next<int(char*, int)>("mkostemp");
  const bool isOurs = counts(path);
  if (isOurs && fails()) return -1;
  const int descriptor = real(path, flags);
  if (isOurs) note(descriptor, Opened::File);
  return descriptor;
}

ssize_t read(int descriptor, void* bytes, size_t size) {
  if (kindOf(descriptor) != Opened::Elsewhere && fails()) return -1;
  return ::syscall(SYS_read, descriptor, bytes, size);
}

ssize_t write(int descriptor, const void* bytes, size_t size) {
  const auto half = [&] { ::syscall(SYS_write, descriptor, bytes, size / 2); };
  if (kindOf(descriptor) != Opened::Elsewhere && fails(half)) return -1;
  return ::syscall(SYS_write, descriptor, bytes, size);
}

/// Only counts: tests do not lose power, and syncing to disk would take most of their time.
int fsync(int descriptor) {
  const auto kind = kindOf(descriptor);
  if (kind == Opened::Elsewhere) return 0;
  if (fails()) return -1;
  ++(kind == Opened::File ? page()->fileSyncs : page()->directorySyncs);
  return 0;
}

/// The descriptor is closed even if the call reports an error.
int close(int descriptor) {
  const bool isToFail = kindOf(descriptor) != Opened::Elsewhere && fails();
  const int error = errno;
  note(descriptor, Opened::Elsewhere);
  const long closed = ::syscall(SYS_close, descriptor);
  if (!isToFail) return static_cast<int>(closed);
  errno = error;
  return -1;
}

int rename(const char* from, const char* to) {
  if (failsFor(to)) return -1;
  if (counts(to)) ++page()->replacements;
  return static_cast<int>(::syscall(SYS_rename, from, to));
}

int renameat2(int, const char* from, int, const char* to, unsigned int flags) {
  if (failsFor(to)) return -1;
  return static_cast<int>(::syscall(SYS_renameat2, AT_FDCWD, from, AT_FDCWD, to, flags));
}

int link(const char* from, const char* to) {
  return failsFor(to) ? -1 : static_cast<int>(::syscall(SYS_link, from, to));
}

int unlink(const char* path) { return failsFor(path) ? -1 : static_cast<int>(::syscall(SYS_unlink, path)); }

int clock_gettime(clockid_t clock, timespec* time) {
  static const char* const second = std::getenv("KVR_CLOCK");
  if (second == nullptr || clock != CLOCK_REALTIME) {
    return static_cast<int>(::syscall(SYS_clock_gettime, clock, time));
  }
  *time = {std::strtoll(second, nullptr, 10), 0};
  return 0;
}

time_t time(time_t* result) {
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME, &now);
  if (result != nullptr) *result = now.tv_sec;
  return now.tv_sec;
}

int mkdir(const char* path, mode_t mode) {
  return failsFor(path) ? -1 : static_cast<int>(::syscall(SYS_mkdir, path, mode));
}

}  // extern "C"
