#pragma once

#include "platform/log/Log.h"
#include "platform/services/Files.h"

#include <condition_variable>
#include <map>
#include <mutex>
#include <set>
#include <thread>

namespace kvr {

/// The files of this machine.
///
/// A new content is written to a temporary file beside its target, ".NAME.kvr-XXXXXX", which then takes the
/// target's place. A temporary file is locked (flock) by its writer for as long as it is one; the first
/// change that this object makes in a directory removes those that nobody holds, which are what a killed
/// process left behind. The lock on a directory is a lock in this process and, for other processes, one on
/// the directory itself (flock).
class LocalFiles : public Files {
 public:
  /// The home directory of the user: HOME, or as the system has it.
  static std::string homeDirectoryOfUser();

  /// `lockPatience`: seconds that a lock waits for other processes.
  explicit LocalFiles(Log& log, std::string homeDirectory = homeDirectoryOfUser(), double lockPatience = 5);

  std::string homeDirectory() const override { return homeDirectory_; }
  Result<std::optional<FileContents>> read(const std::string& path, std::size_t limit) override;
  Result<std::optional<FileStamp>> stamp(const std::string& path) override;
  std::optional<Error> replace(const std::string& path, const std::string& bytes) override;
  std::optional<Error> createDirectory(const std::string& path) override;
  std::optional<Error> remove(const std::string& path) override;
  std::optional<Error> rename(const std::string& from, const std::string& to) override;
  std::optional<Error> renameToUnused(const std::string& from, const std::string& to) override;
  /// When its patience is at an end it goes on without the other processes' consent, and says so in an error
  /// line.
  std::unique_ptr<FileLock> lock(const std::string& directory) override;

 private:
  class Lock;
  struct DirectoryLock {
    std::thread::id owner;
    int depth = 0;  ///< how often the owner holds it; 0: free
    int descriptor = -1;
    bool gaveUp = false;  ///< the last wait for other processes was in vain
  };

  void removeLeftovers(const std::string& directory);
  void lockAgainstOtherProcesses(const std::string& directory, DirectoryLock& state, double patience);
  void unlock(DirectoryLock& state);

  Log& log_;
  const std::string homeDirectory_;
  const double lockPatience_;
  std::mutex mutex_;  ///< guards what follows
  std::condition_variable released_;
  std::map<std::string, DirectoryLock> locks_;
  std::set<std::string> swept_;  ///< directories without leftovers
};

}  // namespace kvr
