#include "local/system/LoadedLibrary.h"

#include <dlfcn.h>

#include <filesystem>
#include <system_error>

namespace kvr {

Result<void*> loadSymbol(const char* library, const char* symbol) {
  std::error_code error;
  const auto program = std::filesystem::read_symlink("/proc/self/exe", error);
  if (error) return Error{"loading", error.value(), "the program's own path is unknown: " + error.message()};
  std::string reasons;
  for (const auto* folder : {".", "../lib/kvragent"}) {
    const auto path = (program.parent_path() / folder / library).lexically_normal();
    if (void* const handle = ::dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE)) {
      if (void* const found = ::dlsym(handle, symbol)) return found;
    }
    const char* const reason = ::dlerror();  // NOLINT(concurrency-mt-unsafe): glibc keeps one per thread
    reasons += (reasons.empty() ? "" : "; ") + std::string(reason == nullptr ? "unknown reason" : reason);
  }
  return Error{"loading", 0, reasons};
}

}  // namespace kvr
