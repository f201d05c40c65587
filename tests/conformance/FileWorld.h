#pragma once

#include "Prelude.h"
#include "integration/support/TemporaryDirectory.h"
#include "local/system/LocalFiles.h"
#include "simulated/SimulatedFiles.h"
#include "simulated/SimulatedLog.h"
#include "simulated/loop/SimulatedClock.h"

namespace kvr {

using testing::contentOfFile;
using testing::TemporaryDirectory;
using testing::writeFile;

inline std::vector<std::string> namesIn(const std::string& directory) {
  std::vector<std::string> names;
  for (const auto& entry : std::filesystem::directory_iterator(directory)) {
    names.push_back(entry.path().filename().string());
  }
  std::ranges::sort(names);
  return names;
}

/// One user's files, on this machine or simulated, with access from outside.
class FileWorld {
 public:
  explicit FileWorld(bool isLocal)
      : directory_(isLocal ? std::make_unique<TemporaryDirectory>() : nullptr),
        local_(filesOfAnotherProcess()) {}

  Files& files() { return local_ ? *local_ : simulated_; }
  /// The same files opened by another process; null for simulated ones.
  std::unique_ptr<Files> filesOfAnotherProcess() {
    return directory_ ? std::make_unique<LocalFiles>(log, directory_->path().string()) : nullptr;
  }
  std::string path(const std::string& name) { return files().homeDirectory() + "/" + name; }

  void put(const std::string& path, const std::string& bytes) {
    local_ ? writeFile(path, bytes) : simulated_.put(path, bytes);
  }
  void putTree(const std::string& path, const Value& tree,
               PropertyListEncoding encoding = PropertyListEncoding::XML) {
    put(path, *writePropertyList(tree, encoding));
  }
  std::optional<std::string> get(const std::string& path) {
    return local_ ? contentOfFile(path) : simulated_.get(path);
  }
  /// Null if there is no file.
  Value tree(const std::string& path) {
    const auto bytes = get(path);
    return bytes ? *readPropertyList(*bytes) : Value();
  }
  void erase(const std::string& path) {
    local_ ? static_cast<void>(std::filesystem::remove(path)) : simulated_.erase(path);
  }
  /// The names directly in a directory, by default the home directory.
  std::vector<std::string> names(const std::string& folder = "") {
    const auto directory = folder.empty() ? files().homeDirectory() : folder;
    if (local_) return namesIn(directory);
    auto paths = simulated_.list(directory);
    for (auto& path : paths) path.erase(0, directory.size() + 1);
    return paths;
  }
  std::vector<std::string> errors() const { return log.texts(LogLevel::Error); }

  SimulatedClock clock{Date{1795536283}};  // 2026-11-24 16:04:43 UTC
  SimulatedLog log;

 private:
  // The order matters: each member uses those above it.
  const std::unique_ptr<TemporaryDirectory> directory_;
  SimulatedFiles simulated_{clock};
  const std::unique_ptr<Files> local_;

 public:
  PropertyListFiles lists{files(), clock, log};
};

/// A test that runs with local and with simulated files.
struct InBothWorlds : ::testing::TestWithParam<bool> {
  static std::string nameOf(const ::testing::TestParamInfo<bool>& info) {
    return info.param ? "Local" : "Simulated";
  }

  FileWorld world{GetParam()};
};

}  // namespace kvr
