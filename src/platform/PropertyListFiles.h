#pragma once

#include "platform/Clock.h"
#include "platform/Files.h"
#include "platform/Log.h"
#include "platform/PropertyList.h"

#include <list>
#include <map>
#include <mutex>

namespace kvr {

/// Property lists on disk, each read afresh when asked and replaced as a whole.
///
/// Every reading is of the file as it is now; a file whose stamp shows that nothing changed is not parsed a
/// second time. Thread-safe; a reader sees the old or the new content. The text of a file must be a dictionary
/// or an array; `Expected` says which.
class PropertyListFiles {
 public:
  enum class Expected { Dictionary, Array };
  /// What becomes of a file that is not what it should be. Either way it is reported once at error level.
  enum class WhenDamaged {
    SetAside,  ///< renamed beside itself to its name with ".damaged-" and a time
    Leave,
  };

  PropertyListFiles(Files& files, const Clock& clock, Log& log);

  /// The file's content; null when it is missing or damaged. An error when it is there but could not be read
  /// (reported once): nothing may then be written in its place.
  Result<Value> read(const std::string& path, Expected expected, WhenDamaged whenDamaged);

  /// Replaces the file, creating its directory as needed. On failure the old file stays.
  std::optional<Error> write(const std::string& path, const Value& tree, PropertyListEncoding encoding);

  Files& files() { return files_; }

 private:
  struct Parsed {
    FileStamp stamp;
    Expected expected;
    Value tree;
    std::list<std::string>::iterator age;
  };

  std::optional<Value> remembered(const std::string& path, const FileStamp& stamp, Expected expected);
  void remember(const std::string& path, const FileStamp& stamp, Expected expected, const Value& tree);
  void forget(const std::string& path);
  void handleDamage(const std::string& path, const Error& error, const FileStamp& stamp, WhenDamaged whenDamaged);
  void reportOnce(const std::string& path, const std::string& complaint, const FileStamp& stamp);

  Files& files_;
  const Clock& clock_;
  Log& log_;
  std::mutex mutex_;  ///< guards what follows
  std::map<std::string, Parsed> parsed_;
  std::list<std::string> byAge_;  ///< paths of `parsed_`, the longest unused first
  std::uint64_t parsedBytes_ = 0;
  std::map<std::string, FileStamp> reported_;
};

}  // namespace kvr
