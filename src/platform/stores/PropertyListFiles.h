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

/// Property lists on disk, each read afresh when asked and replaced as a whole.
///
/// Every reading is of the file as it is now; a file whose stamp shows that nothing changed is not parsed a
/// second time. Thread-safe; a reader sees the old or the new content. The text of a file must be a
/// dictionary or an array; `Expected` says which. Files of more than `kLimit` bytes are neither read nor
/// written.
class PropertyListFiles {
 public:
  enum class Expected { Dictionary, Array };
  /// What becomes of a file that is not what it should be. Either way it is reported once at error level.
  enum class WhenDamaged {
    SetAside,  ///< renamed beside itself to its name with ".damaged-" and a time
    Leave,
  };

  static constexpr std::size_t kLimit = 16UL * 1024 * 1024;

  PropertyListFiles(Files& files, const Clock& clock, Log& log);

  /// What a reader finds wrong with a tree of the expected kind, if anything.
  using Complaint = std::function<std::optional<Error>(const Value& tree)>;

  /// The file's content; null when it is missing or damaged. An error when it is there but could not be read
  /// (reported once): nothing may then be written in its place. A file of which `complaint` complains counts
  /// as damaged.
  Result<Value> read(const std::string& path, Expected expected, WhenDamaged whenDamaged,
                     const Complaint& complaint = nullptr);

  /// Replaces the file; first creates its directory as needed, even for a tree that then cannot be written.
  /// On failure the old file stays.
  std::optional<Error> write(const std::string& path, const Value& tree, PropertyListEncoding encoding);

  /// As `Files::lock`, for a change that depends on what is read under it: from here on it is read anew.
  std::unique_ptr<FileLock> lock(const std::string& directory);

  Files& files() { return files_; }

  class Look;

 private:
  /// What was made of a file: its tree, or why it is no property list.
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
  std::mutex mutex_;  ///< guards what follows; never held while a file is touched
  std::map<std::string, Remembered> remembered_;
  std::list<std::string> byAge_;  ///< paths of `remembered_`, the longest unused first
  std::uint64_t rememberedBytes_ = 0;
  std::map<std::string, Report> reported_;  ///< the last complaint about each file that is not sound
};

/// Makes what its thread reads be of one moment, for facts that are weighed together: a file that was read
/// once is not looked at again, and later readings give what the first one found. It ends with its scope, or
/// when its thread changes something. To be held while nothing is waited for; within another one it does
/// nothing.
class PropertyListFiles::Look {
 public:
  explicit Look(const PropertyListFiles& lists);
  ~Look();
  Look(const Look&) = delete;
  Look& operator=(const Look&) = delete;

 private:
  friend class PropertyListFiles;

  static thread_local Look* current;  ///< the one that counts on this thread

  const PropertyListFiles& lists_;
  std::map<std::string, std::optional<Parsed>> seen_;
};

}  // namespace kvr
