#pragma once

#include "platform/value/Error.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace kvr {

/// Tells whether a file has changed, without reading it.
struct FileStamp {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  std::uint64_t size = 0;
  std::int64_t modifiedNanoseconds = 0;  ///< since 1970
  std::int64_t changedNanoseconds = 0;   ///< of the inode, since 1970
  /// False while the file was changed so recently that another change could produce the same stamp. Such a
  /// stamp must not be used to skip reading the file.
  bool settled = false;

  friend bool operator==(const FileStamp&, const FileStamp&) = default;
};

struct FileContents {
  std::string bytes;
  FileStamp stamp;
};

/// A lock against other threads and processes, held until it is destroyed.
class FileLock {
 public:
  virtual ~FileLock() = default;
};

/// Reads and replaces whole files, below the user's home directory or wherever a setting points. Paths are
/// absolute.
///
/// Any thread; calls may block on the disk. Only regular files are read or replaced; errors are in domain
/// "files" with errno as code.
class Files {
 public:
  virtual ~Files() = default;
  /// The user's home directory, without a trailing slash.
  virtual std::string homeDirectory() const = 0;
  /// The whole content; nothing when there is no such file. More than `limit` bytes is an error.
  virtual Result<std::optional<FileContents>> read(const std::string& path, std::size_t limit) = 0;
  /// The stamp of the file as it is now; nothing when there is no such file.
  virtual Result<std::optional<FileStamp>> stamp(const std::string& path) = 0;
  /// Replaces a file's content atomically and durably, mode 0600. On failure the old file stays and nothing
  /// else is left behind.
  virtual std::optional<Error> replace(const std::string& path, const std::string& bytes) = 0;
  /// Creates a directory and its missing parents, mode 0700. No error when it exists.
  virtual std::optional<Error> createDirectory(const std::string& path) = 0;
  /// Removes a file durably. A missing file is an error.
  virtual std::optional<Error> remove(const std::string& path) = 0;
  /// Renames durably, within one directory. Replaces a file that has the new name.
  virtual std::optional<Error> rename(const std::string& from, const std::string& to) = 0;
  /// As `rename`, but replaces nothing: if the new name is taken, the error has code EEXIST.
  virtual std::optional<Error> renameToUnused(const std::string& from, const std::string& to) = 0;
  /// Takes the lock for changing files in `directory`, which is created if it is missing. Waits for other
  /// threads, but for other processes only some seconds: a process that hangs must not hang the agent, so
  /// after that the lock holds within this process only, which is logged. The lock is recursive; release it
  /// on the thread that took it.
  virtual std::unique_ptr<FileLock> lock(const std::string& directory) = 0;
};

}  // namespace kvr
