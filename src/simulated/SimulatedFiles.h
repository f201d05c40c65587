#pragma once

#include "platform/services/Clock.h"
#include "platform/services/Files.h"
#include "platform/value/Value.h"
#include "simulated/loop/SimulatedWorkQueues.h"

#include <functional>
#include <map>
#include <mutex>
#include <random>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace kvr {

/// Files in memory, with faults on demand.
///
/// They outlive the objects that use them: to simulate a crash and a restart, destroy the users and build new
/// ones on the same files. A file is replaced in the same steps as on disk; what was not synced may be lost
/// with the power. Thread-safe.
class SimulatedFiles : public Files {
 public:
  static constexpr const char* kHomeDirectory = "/home/user";

  /// With queues, items that change files may be suspended before each step, and wait for locks in virtual
  /// time.
  explicit SimulatedFiles(const Clock& clock, SimulatedWorkQueues* queues = nullptr);

  std::string homeDirectory() const override { return kHomeDirectory; }
  Result<std::optional<FileContents>> read(const std::string& path, std::size_t limit) override;
  Result<std::optional<FileStamp>> stamp(const std::string& path) override;
  std::optional<Error> replace(const std::string& path, const std::string& bytes) override;
  std::optional<Error> createDirectory(const std::string& path) override;
  std::optional<Error> remove(const std::string& path) override;
  std::optional<Error> rename(const std::string& from, const std::string& to) override;
  std::optional<Error> renameToUnused(const std::string& from, const std::string& to) override;
  std::unique_ptr<FileLock> lock(const std::string& directory) override;

  // Changes and reads from outside the simulated program: no fault applies to them and no counter counts
  // them.
  /// Stores a file and creates its directories.
  void put(const std::string& path, std::string bytes);
  /// Stores a tree as a binary property list.
  void putPropertyList(const std::string& path, const Value& tree);
  std::optional<std::string> get(const std::string& path) const;
  /// The tree in a file; null when there is no such file or it holds no property list.
  Value getPropertyList(const std::string& path) const;
  /// Whether there is such a file and it holds a property list.
  bool holdsPropertyList(const std::string& path) const;
  void erase(const std::string& path);
  /// The paths of the files in `directory` and below it that contain `part`, in ascending order.
  std::vector<std::string> list(const std::string& directory, std::string_view part = {}) const;

  // Faults last until they are set to nothing. A fault for one file takes precedence over that for all files.
  void setReadFault(std::optional<Error> error);
  void setReadFault(const std::string& path, std::optional<Error> error);
  /// For everything that changes a file or directory.
  void setWriteFault(std::optional<Error> error);
  void setWriteFault(const std::string& path, std::optional<Error> error);

  /// The kinds of steps that a change consists of.
  enum class Step { CreateTemporary, Write, Sync, Rename, SyncDirectory, Remove };
  /// Called before every step of a change, with the path to be changed; an error that it returns replaces the
  /// step.
  using StepFault = std::function<std::optional<Error>(Step step, const std::string& path)>;
  void setStepFault(StepFault fault);
  using Changed = std::function<void(const std::string& path, bool isDone)>;
  /// Called with the path after every attempted change; `isDone` is true if all its steps were done.
  void whenChanged(Changed changed);

  /// Simulates a killed process: after `count` more steps, no step has an effect.
  void killAfterSteps(std::size_t count);
  bool isKilled() const;
  /// The paths whose changes have begun and not ended.
  std::set<std::string> changing() const;
  /// Replaces these files by those of another instance.
  void takeOver(const SimulatedFiles& other);
  /// Loses what was not synced, as far as `random` decides: the latest changes of names, and the end of
  /// contents.
  void losePower(std::mt19937_64& random);

  /// How often a file was read as a whole.
  std::size_t readCount() const;

 private:
  class Replacement;
  class Changing;
  struct File {
    std::string bytes;
    FileStamp stamp;
    bool isSynced = true;
    mutable std::optional<Result<Value>> tree = std::nullopt;  ///< the property list in it, once read

    void setBytes(std::string newBytes);
    const Result<Value>& propertyList() const;
  };
  /// A change of the file under a name that is not durable yet.
  struct Unsynced {
    std::string path;
    std::optional<File> before;
  };
  struct Faults {
    std::optional<Error> all;
    std::map<std::string, Error> byPath;

    void set(const std::string& path, std::optional<Error> error);
    std::optional<Error> of(const std::string& path) const;
  };

  std::optional<Error> writeFaultOf(const std::string& path) const;
  std::optional<Error> begin(Step step, const std::string& path);
  std::optional<Error> syncDirectoryOf(const std::string& path);
  void store(const std::string& path, std::string bytes, bool isSynced);
  void put(const std::string& path, std::optional<File> file);
  void removeLeftovers(const std::string& directory);
  bool hasEnded() const;
  void tellChange(std::unique_lock<std::mutex>& lock, const std::string& path, bool isDone);
  void addDirectories(std::string path);
  std::optional<Error> move(const std::string& from, const std::string& to, bool replaces);

  const Clock& clock_;
  SimulatedWorkQueues* const queues_;
  mutable std::mutex mutex_;  ///< guards what follows
  std::map<std::string, File> files_;
  std::set<std::string> directories_;
  std::uint64_t lastInode_ = 0;
  Faults readFaults_;
  Faults writeFaults_;
  StepFault stepFault_;
  Changed changed_;
  std::vector<Unsynced> unsynced_;  ///< oldest first
  std::set<std::string> swept_;     ///< directories already cleared of leftovers of earlier processes
  std::optional<std::size_t> lastStep_;
  std::size_t steps_ = 0;
  std::size_t reads_ = 0;
  std::map<std::string, std::shared_ptr<Turns>> locks_;
  std::multiset<std::string> changing_;
};

}  // namespace kvr
