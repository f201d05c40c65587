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
/// A file is replaced by writing a temporary file beside it, ".NAME.kvr-XXXXXX", and renaming that. The
/// writer holds a lock (flock) on its temporary file. The first `replace` in a directory removes the
/// temporary files there that nobody has locked: a killed process has left them behind. A directory is locked
/// within this process by a lock of its own, and against other processes by flock on the directory.
class LocalFiles : public Files {
 public:
  /// The user's home directory: HOME, or else from the user database.
  static std::string homeDirectoryOfUser();

  /// `lockPatience`: how long to wait for other processes' locks, in seconds.
  explicit LocalFiles(Log& log, std::string homeDirectory = homeDirectoryOfUser(), double lockPatience = 5);

  std::string homeDirectory() const override { return homeDirectory_; }
  Result<std::optional<FileContents>> read(const std::string& path, std::size_t limit) override;
  Result<std::optional<FileStamp>> stamp(const std::string& path) override;
  std::optional<Error> replace(const std::string& path, const std::string& bytes) override;
  std::optional<Error> createDirectory(const std::string& path) override;
  std::optional<Error> remove(const std::string& path) override;
  std::optional<Error> rename(const std::string& from, const std::string& to) override;
  std::optional<Error> renameToUnused(const std::string& from, const std::string& to) override;
  /// When the wait for other processes times out, goes on without their lock; an error is logged once.
  std::unique_ptr<FileLock> lock(const std::string& directory) override;

 private:
  class Lock;
  struct DirectoryLock {
    std::thread::id owner;
    int depth = 0;  ///< how often the owner holds it; 0: free
    int descriptor = -1;
    bool gaveUp = false;  ///< the last wait for other processes timed out
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
  std::set<std::string> swept_;  ///< directories already cleared of leftovers
};

}  // namespace kvr
