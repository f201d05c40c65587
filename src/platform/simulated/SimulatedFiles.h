#pragma once

#include "platform/Clock.h"
#include "platform/Files.h"
#include "platform/Value.h"

#include <map>
#include <mutex>
#include <set>
#include <vector>

namespace kvr {

/// Files in memory, with faults on demand.
///
/// They outlive whatever uses them, so a crash and a restart are: destroy the users, build them again on the
/// same files. Thread-safe.
class SimulatedFiles : public Files {
 public:
  static constexpr const char* kHomeDirectory = "/home/user";

  explicit SimulatedFiles(const Clock& clock);

  std::string homeDirectory() const override { return kHomeDirectory; }
  Result<std::optional<FileContents>> read(const std::string& path, std::size_t limit) override;
  std::optional<FileStamp> stamp(const std::string& path) override;
  std::optional<Error> replace(const std::string& path, const std::string& bytes) override;
  std::optional<Error> createDirectory(const std::string& path) override;
  std::optional<Error> remove(const std::string& path) override;
  std::optional<Error> rename(const std::string& from, const std::string& to) override;
  std::optional<Error> renameToUnused(const std::string& from, const std::string& to) override;
  std::unique_ptr<FileLock> lock(const std::string& directory) override;

  // Changes and looks from outside: no fault stops them, and they count for nothing.
  /// Puts a file, and its directories, in place.
  void put(const std::string& path, std::string bytes);
  /// As `put`, for a tree, in the binary encoding.
  void putPropertyList(const std::string& path, const Value& tree);
  std::optional<std::string> get(const std::string& path) const;
  /// The tree that a file holds; null when there is no such file or it holds none.
  Value getPropertyList(const std::string& path) const;
  void erase(const std::string& path);
  /// The paths of the files in `directory` and below it, in ascending order.
  std::vector<std::string> list(const std::string& directory) const;

  // Faults last until they are set to nothing. A file's own fault goes before that of all files.
  void setReadFault(std::optional<Error> error);
  void setReadFault(const std::string& path, std::optional<Error> error);
  /// Of everything that changes a file or directory.
  void setWriteFault(std::optional<Error> error);
  void setWriteFault(const std::string& path, std::optional<Error> error);

  /// The end of the process at a point between two changes: after `count` more, no change reaches a file.
  void killAfterWrites(std::size_t count);
  bool isKilled() const;
  /// The files as another instance has them, in the place of these.
  void takeOver(const SimulatedFiles& other);

  /// How often a file was replaced, renamed or removed so far, and how often one was read as a whole.
  std::size_t writeCount() const;
  std::size_t readCount() const;

 private:
  struct File {
    std::string bytes;
    FileStamp stamp;
  };
  struct Faults {
    std::optional<Error> all;
    std::map<std::string, Error> byPath;

    void set(const std::string& path, std::optional<Error> error);
    std::optional<Error> of(const std::string& path) const;
  };

  std::optional<Error> writeFaultOf(const std::string& path) const;
  void store(const std::string& path, std::string bytes);
  void addDirectories(std::string path);
  std::optional<Error> move(const std::string& from, const std::string& to, bool replaces);

  const Clock& clock_;
  mutable std::mutex mutex_;  ///< guards what follows
  std::map<std::string, File> files_;
  std::set<std::string> directories_;
  std::uint64_t lastInode_ = 0;
  Faults readFaults_;
  Faults writeFaults_;
  std::optional<std::size_t> lastWrite_;
  std::size_t writes_ = 0;
  std::size_t reads_ = 0;
  std::map<std::string, std::recursive_mutex> locks_;
};

}  // namespace kvr
