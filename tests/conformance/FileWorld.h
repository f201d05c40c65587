#pragma once

#include "Prelude.h"
#include "integration/support/TemporaryDirectory.h"
#include "platform/local/LocalFiles.h"
#include "platform/simulated/SimulatedClock.h"
#include "platform/simulated/SimulatedFiles.h"
#include "platform/simulated/SimulatedLog.h"

#include <algorithm>
#include <filesystem>
#include <fstream>

namespace kvr {

using testing::contentOfFile;
using testing::TemporaryDirectory;

inline void writeFile(const std::string& path, const std::string& bytes) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream(path, std::ios::binary | std::ios::trunc) << bytes;
}

/// One user's files, of this machine or simulated, as they are seen from outside.
class FileWorld {
 public:
  explicit FileWorld(bool isLocal) {
    if (isLocal) {
      directory_ = std::make_unique<TemporaryDirectory>();
      local_ = std::make_unique<LocalFiles>(log, directory_->path().string());
    } else {
      simulated_ = std::make_unique<SimulatedFiles>(clock);
    }
  }

  Files& files() { return local_ ? static_cast<Files&>(*local_) : *simulated_; }
  /// The same files as another process has them.
  std::unique_ptr<Files> filesOfAnotherProcess() {
    return local_ ? std::make_unique<LocalFiles>(log, directory_->path().string()) : nullptr;
  }
  std::string path(const std::string& name) { return files().homeDirectory() + "/" + name; }

  void put(const std::string& path, const std::string& bytes) {
    simulated_ ? simulated_->put(path, bytes) : writeFile(path, bytes);
  }
  std::optional<std::string> get(const std::string& path) {
    return simulated_ ? simulated_->get(path) : contentOfFile(path);
  }
  void erase(const std::string& path) {
    simulated_ ? simulated_->erase(path) : static_cast<void>(std::filesystem::remove(path));
  }
  /// The names in the home directory's own level, of files only.
  std::vector<std::string> names(const std::string& directory) {
    std::vector<std::string> names;
    if (simulated_) {
      for (const auto& path : simulated_->list(directory)) names.push_back(path.substr(directory.size() + 1));
    } else {
      for (const auto& entry : std::filesystem::directory_iterator(directory)) {
        names.push_back(entry.path().filename().string());
      }
    }
    std::ranges::sort(names);
    return names;
  }

  SimulatedClock clock{Date{1795536283}};  // 2026-11-24 16:04:43 UTC
  SimulatedLog log;

 private:
  std::unique_ptr<TemporaryDirectory> directory_;
  std::unique_ptr<LocalFiles> local_;
  std::unique_ptr<SimulatedFiles> simulated_;
};

/// A test that runs in both worlds.
class InBothWorlds : public ::testing::TestWithParam<bool> {
 public:
  static std::string nameOf(const ::testing::TestParamInfo<bool>& info) {
    return info.param ? "Local" : "Simulated";
  }

 protected:
  FileWorld world{GetParam()};
};

}  // namespace kvr
