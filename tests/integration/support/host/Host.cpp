#include "integration/support/Host.h"

#include <dlfcn.h>
#include <netdb.h>
#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string_view>

namespace kvr::testing {

std::atomic<std::int64_t> clockAhead{0};

namespace {

template <class Function>
Function* next(const char* name) {
  return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

/// The file that stands in for the system's list of trusted authorities.
const char* standInFor(const char* path) {
  const char* const trusted = std::getenv(kTrustedAuthorities);
  return trusted && std::string_view(path).ends_with("/ca-certificates.crt") ? trusted : path;
}

}  // namespace
}  // namespace kvr::testing

extern "C" {

FILE* fopen(const char* path, const char* mode) {
  static auto* const real = kvr::testing::next<FILE*(const char*, const char*)>("fopen");
  return real(kvr::testing::standInFor(path), mode);
}

FILE* fopen64(const char* path, const char* mode) {
  static auto* const real = kvr::testing::next<FILE*(const char*, const char*)>("fopen64");
  return real(kvr::testing::standInFor(path), mode);
}

int getaddrinfo(const char* node, const char* service, const addrinfo* hints, addrinfo** result) {
  static auto* const real =
      kvr::testing::next<int(const char*, const char*, const addrinfo*, addrinfo**)>("getaddrinfo");
  const bool isExample = node && std::string_view(node).ends_with(".example");
  return real(isExample ? "127.0.0.1" : node, service, hints, result);
}

int clock_gettime(clockid_t clock, timespec* now) noexcept {
  const auto result = static_cast<int>(::syscall(SYS_clock_gettime, clock, now));
  if (clock == CLOCK_MONOTONIC) now->tv_sec += kvr::testing::clockAhead;
  return result;
}

}  // extern "C"
