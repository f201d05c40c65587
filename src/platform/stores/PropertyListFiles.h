#pragma once

#include "platform/codec/PropertyList.h"
#include "platform/log/Log.h"
#include "platform/services/Clock.h"
#include "platform/services/Files.h"

#include <functional>
#include <list>
#include <map>
#include <mutex>

namespace kvr {

/// Reads and replaces whole property lists on disk.
///
/// Every read gives the file's current content (within a `Look`, the snapshot's); a parsed file is cached and
/// reused while its stamp is unchanged. Thread-safe; a reader sees the complete old or new content. The top
/// level must be a dictionary or an array, as `Expected` says. Files of more than `kLimit` bytes are neither
/// read nor written.
class PropertyListFiles {
 public:
  enum class Expected { Dictionary, Array };
  /// What to do with a damaged file. Either way it is logged once as an error.
  enum class WhenDamaged {
    SetAside,  ///< renamed in its directory: ".damaged-" and the time are appended
    Leave,
  };

  static constexpr std::size_t kLimit = 16UL * 1024 * 1024;

  PropertyListFiles(Files& files, const Clock& clock, Log& log);

  /// A further check by the caller: what is wrong with a tree of the expected kind, or nothing.
  using Complaint = std::function<std::optional<Error>(const Value& tree)>;

  /// The file's content; null when the file is missing or damaged. An error, logged once, when it exists but
  /// cannot be read: then it must not be overwritten. A file that fails the `complaint` check counts as
  /// damaged.
  Result<Value> read(const std::string& path, Expected expected, WhenDamaged whenDamaged,
                     const Complaint& complaint = nullptr);

  /// Replaces the file. First creates its directory if needed, even if the tree then cannot be written. On
  /// failure the old file stays.
  std::optional<Error> write(const std::string& path, const Value& tree, PropertyListEncoding encoding);

  /// As `Files::lock`. Also ends this thread's snapshot, so that reads under the lock give the current
  /// content.
  std::unique_ptr<FileLock> lock(const std::string& directory);

  Files& files() { return files_; }

  class Look;

 private:
  /// The result of parsing a file: its tree, or the error.
  struct Parsed {
    FileStamp stamp;
    Result<Value> outcome;
  };
  struct Remembered {
    Parsed parsed;
    std::list<std::string>::iterator age;
  };
  struct Report {
    std::string complaint;
    FileStamp stamp;
  };

  Result<std::optional<Parsed>> parse(const std::string& path);
  Result<std::optional<Parsed>> parseOnce(const std::string& path);
  std::optional<Parsed> remembered(const std::string& path, const FileStamp& stamp);
  void remember(const std::string& path, const Parsed& parsed);
  void forget(const std::string& path);
  void forgetWhileLocked(const std::string& path);
  std::optional<Result<Value>> setAside(const std::string& path, const Error& reason, const FileStamp& stamp);
  Error reportUnreadable(const std::string& path, const Error& error);
  bool isNews(const std::string& path, const std::string& complaint, const FileStamp& stamp);
  void noteSound(const std::string& path);

  Files& files_;
  const Clock& clock_;
  Log& log_;
  std::mutex mutex_;  ///< guards the members below; never held while a file is accessed
  std::map<std::string, Remembered> remembered_;
  std::list<std::string> byAge_;  ///< paths of `remembered_`, least recently used first
  std::uint64_t rememberedBytes_ = 0;
  std::map<std::string, Report> reported_;  ///< the last logged complaint about each bad file
};

/// A snapshot for the current thread, for decisions that need consistent facts: while it exists, a file is
/// read once, and later reads on this thread return the same content. It ends with its scope, or when the
/// thread takes a lock or writes. Do not wait while one is alive; a nested one has no effect.
class PropertyListFiles::Look {
 public:
  explicit Look(const PropertyListFiles& lists);
  ~Look();
  Look(const Look&) = delete;
  Look& operator=(const Look&) = delete;

 private:
  friend class PropertyListFiles;

  static thread_local Look* current;  ///< the active snapshot of this thread

  const PropertyListFiles& lists_;
  std::map<std::string, std::optional<Parsed>> seen_;
};

}  // namespace kvr
