// Reads files while memory is short: each allocation fails once, one after the other.
#include "Fuzz.h"
#include "platform/codec/JSON.h"
#include "platform/stores/FilePreferences.h"
#include "platform/stores/PropertyListFiles.h"
#include "simulated/SimulatedFiles.h"
#include "simulated/SimulatedLog.h"
#include "simulated/loop/SimulatedClock.h"

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <new>

namespace {

std::size_t allocations = 0;
std::size_t failing = 0;  ///< number of the allocation that fails, from 1; 0 for none
std::ptrdiff_t held = 0;

/// Whether this allocation must fail.
bool fails() { return ++allocations == failing; }

}  // namespace

extern "C" {
void* __libc_malloc(std::size_t size);
void* __libc_memalign(std::size_t alignment, std::size_t size);
void* __libc_realloc(void* memory, std::size_t size);
void __libc_free(void* memory);

void* malloc(std::size_t size) noexcept {
  void* const memory = fails() ? nullptr : __libc_malloc(size);
  if (memory != nullptr) ++held;
  return memory;
}
void* aligned_alloc(std::size_t alignment, std::size_t size) noexcept {
  void* const memory = fails() ? nullptr : __libc_memalign(alignment, size);
  if (memory != nullptr) ++held;
  return memory;
}
void* realloc(void* memory, std::size_t size) noexcept {
  void* const grown = fails() ? nullptr : __libc_realloc(memory, size);
  if (memory == nullptr && grown != nullptr) ++held;
  return grown;
}
void free(void* memory) noexcept {
  if (memory != nullptr) --held;
  __libc_free(memory);
}

}  // extern "C"

namespace kvr::fuzz {

namespace {

/// Calls the function once for each of its allocations, which then fails; returns the number of allocations.
/// Only `bad_alloc` may be thrown, and nothing may stay allocated.
template <class Work>
std::size_t starve(const Work& work) {
  for (std::size_t at = 0;; ++at) {
    const auto before = held;
    allocations = 0;
    failing = at;  // none fails the first time, while one-time data is allocated
    try {
      work();
    } catch (const std::bad_alloc&) {
    }
    failing = 0;
    if (at == 0) continue;
    require(held == before, "nothing stays allocated");
    if (allocations < at) return at - 1;
  }
}

std::size_t starveReader(Result<Value> (*read)(std::string_view), std::string_view bytes) {
  const auto expected = read(bytes);
  return starve([&] {
    const auto tree = read(bytes);
    require(bool(tree) == bool(expected), "the same outcome, or none");
    require(!tree || *tree == *expected, "the right value, or none");
  });
}

/// A file must not count as damaged because memory was short, and is replaced completely or not at all.
std::size_t starveFile(const std::string& bytes) {
  constexpr const char* kPath = "/home/user/Library/Preferences/domain.plist";
  SimulatedClock clock;
  SimulatedFiles files(clock);
  SimulatedLog log;
  files.put(kPath, bytes);
  const auto expected = readPropertyList(bytes);
  if (!expected || !expected->isDictionary()) return 0;
  auto points = starve([&] {
    PropertyListFiles lists(files, clock, log);
    const auto tree =
        lists.read(kPath, PropertyListFiles::Expected::Dictionary, PropertyListFiles::WhenDamaged::SetAside);
    require(tree && *tree == *expected, "the right value, or none");
  });
  auto changed = expected->dictionary();
  changed.insert_or_assign("key", "a value that is not a short one at all");
  points += starve([&] {
    SimulatedFiles own(clock);
    own.put(kPath, bytes);
    bool isShort = false;
    try {
      PropertyListFiles lists(own, clock, log);
      FilePreferences(lists, log, "domain").setObject(changed.at("key"), "key");
    } catch (const std::bad_alloc&) {
      isShort = true;
    }
    failing = 0;
    const auto found = own.getPropertyList(kPath);
    require(found == Value(changed) || (isShort && found == *expected), "the new content, or the old one");
    require(isShort || own.list("/home/user").size() == 1, "one file");
  });
  require(log.texts().empty(), "nothing to report");
  return points;
}

std::size_t starveAllIn(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  const std::string bytes(std::istreambuf_iterator<char>(file), {});
  const bool isJSON = path.parent_path().filename() == "json";
  return starveReader(isJSON ? readJSON : readPropertyList, bytes) + (isJSON ? 0 : starveFile(bytes));
}

}  // namespace
}  // namespace kvr::fuzz

int main(int argc, char** argv) {
  std::size_t points = 0;
  for (int argument = 1; argument < argc; ++argument) {
    for (const auto& entry : std::filesystem::directory_iterator(argv[argument])) {
      std::fprintf(stderr, "%s\n", entry.path().c_str());
      points += kvr::fuzz::starveAllIn(entry.path());
    }
  }
  std::printf("%zu allocations\n", points);
  return points > 0 ? 0 : 1;
}
