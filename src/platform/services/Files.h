#pragma once

#include "platform/value/Error.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace kvr {

/// What tells one content of a file from another without reading it.
struct FileStamp {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  std::uint64_t size = 0;
  std::int64_t modifiedNanoseconds = 0;  ///< since 1970
  std::int64_t changedNanoseconds = 0;   ///< of the inode, since 1970
  /// False while the file is so young that a further change could leave the same stamp: such a stamp must not
  /// be used to skip a reading.
  bool settled = false;

  friend bool operator==(const FileStamp&, const FileStamp&) = default;
};

struct FileContents {
  std::string bytes;
  FileStamp stamp;
};

/// Holds off other holders of the same lock, in this process and in others, until it is destroyed.
class FileLock {
 public:
  virtual ~FileLock() = default;
};

/// Whole files below the user's home directory and wherever settings name one. Paths are absolute.
///
/// Any thread; calls may block for as long as the disk does. Only regular files are read or replaced; errors
/// are in domain "files" with errno as code.
class Files {
 public:
  virtual ~Files() = default;
  /// The user's home directory, without a trailing slash.
  virtual std::string homeDirectory() const = 0;
  /// The whole content; nothing when there is no such file. More than `limit` bytes is an error.
  virtual Result<std::optional<FileContents>> read(const std::string& path, std::size_t limit) = 0;
  /// The stamp of the file as it is now; nothing when there is no such file.
  virtual Result<std::optional<FileStamp>> stamp(const std::string& path) = 0;
  /// Puts a new content in a file's place, atomically and durably, mode 0600. On failure the old file stays
  /// and nothing else is left behind.
  virtual std::optional<Error> replace(const std::string& path, const std::string& bytes) = 0;
  /// Creates a directory and its missing parents, mode 0700. No error when it exists.
  virtual std::optional<Error> createDirectory(const std::string& path) = 0;
  /// Durably. A missing file is an error.
  virtual std::optional<Error> remove(const std::string& path) = 0;
  /// Durably, within one directory; replaces what bears the new name.
  virtual std::optional<Error> rename(const std::string& from, const std::string& to) = 0;
  /// As `rename`, but replaces nothing: when anything bears the new name, an error with code EEXIST.
  virtual std::optional<Error> renameToUnused(const std::string& from, const std::string& to) = 0;
  /// The lock on changes of the files in `directory`, which is created if it is missing. It waits for other
  /// holders, for some seconds at most: a holder that hangs must not hang the agent. The thread that holds it
  /// may take it again; it is given back on that thread.
  virtual std::unique_ptr<FileLock> lock(const std::string& directory) = 0;
};

}  // namespace kvr
