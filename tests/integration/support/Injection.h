#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

namespace kvr::testing {

/// A memory page shared by a test and a program under the injector: the test sets which calls fail, the
/// injector counts.
///
/// Only the program's calls on files and directories at and below `path` count.
struct Injection {
  static constexpr const char* kVariable = "KVR_INJECTION";  ///< the name of the page's file
  static constexpr std::int32_t kKill = 0;
  static constexpr std::size_t kLongestPath = 512;

  std::atomic<std::uint32_t> first{0};  ///< the first call that fails, counted from 1; 0 for none
  std::atomic<std::uint32_t> last{0};   ///< the last one that fails
  std::atomic<std::int32_t> error{0};   ///< their errno, or `kKill` to kill the program instead
  std::atomic<std::uint32_t> calls{0};
  std::atomic<std::uint32_t> fileSyncs{0};
  std::atomic<std::uint32_t> directorySyncs{0};
  std::atomic<std::uint32_t> replacements{0};
  char path[kLongestPath]{};
};

}  // namespace kvr::testing
