#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

namespace kvr::testing {

/// What a test tells the injector, and what that tells the test: one page that a program which is run under
/// it shares with the test.
///
/// What counts are the program's calls to the system about files and directories at and below `path`.
struct Injection {
  static constexpr const char* kVariable = "KVR_INJECTION";  ///< names the page's file
  static constexpr std::int32_t kKill = 0;
  static constexpr std::size_t kLongestPath = 512;

  std::atomic<std::uint32_t> first{0};  ///< the first call that fails, counted from 1; 0 for none
  std::atomic<std::uint32_t> last{0};   ///< the last one
  std::atomic<std::int32_t> error{0};   ///< its errno, or `kKill` for the program's end in its place
  std::atomic<std::uint32_t> calls{0};
  std::atomic<std::uint32_t> fileSyncs{0};
  std::atomic<std::uint32_t> directorySyncs{0};
  std::atomic<std::uint32_t> replacements{0};
  char path[kLongestPath]{};
};

}  // namespace kvr::testing
