#pragma once

#include <atomic>
#include <cstdint>

namespace kvr::testing {

/// The host as a test wants it: calls of the C library answer differently from the real machine. A program
/// under test preloads them (LD_PRELOAD); the test program contains them.
///
/// Certificate authorities are trusted from the file that this variable names, if it is set, and hosts below
/// "example" have the address 127.0.0.1.
inline constexpr const char* kTrustedAuthorities = "KVR_TEST_AUTHORITIES";

/// How far the monotonic clock of this process is ahead, in seconds.
extern std::atomic<std::int64_t> clockAhead;

}  // namespace kvr::testing
