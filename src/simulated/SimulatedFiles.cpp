#include "simulated/SimulatedFiles.h"

#include "platform/codec/PropertyList.h"
#include "platform/stores/AtomicReplace.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace kvr {
namespace {

constexpr std::string_view kTemporaryTag = ".kvr-";

Error failure(int code, const std::string& path) {
  return {"files", code, path + ": " + std::generic_category().message(code)};
}

std::string directoryOf(const std::string& path) {
  const auto slash = path.rfind('/');
  return slash == std::string::npos || slash == 0 ? "/" : path.substr(0, slash);
}

std::int64_t nanoseconds(Date date) {
  constexpr double kLast = 9e9;  // seconds; the year 2255
  const double seconds = std::isfinite(date.secondsSince1970) ? date.secondsSince1970 : 0;
  return static_cast<std::int64_t>(std::clamp(seconds, -kLast, kLast) * 1e9);
}

class Lock : public FileLock {
 public:
  explicit Lock(std::shared_ptr<Turns> turns) : turns_(std::move(turns)), turn_(*turns_) {}

 private:
  const std::shared_ptr<Turns> turns_;
  const Turn turn_;
};

}  // namespace

void SimulatedFiles::File::setBytes(std::string newBytes) {
  bytes = std::move(newBytes);
  stamp.size = bytes.size();
  tree.reset();
}

const Result<Value>& SimulatedFiles::File::propertyList() const {
  if (!tree) tree = readPropertyList(bytes);
  return *tree;
}

SimulatedFiles::SimulatedFiles(const Clock& clock, SimulatedWorkQueues* queues)
    : clock_(clock), queues_(queues) {
  addDirectories(kHomeDirectory);
}

Result<std::optional<FileContents>> SimulatedFiles::read(const std::string& path, std::size_t limit) {
  const std::lock_guard lock(mutex_);
  if (auto fault = readFaults_.of(path)) return *std::move(fault);
  if (directories_.contains(path)) return failure(EISDIR, path);
  const auto found = files_.find(path);
  if (found == files_.end()) return std::optional<FileContents>();
  if (found->second.bytes.size() > limit) return failure(EFBIG, path);
  ++reads_;
  return std::optional(FileContents{found->second.bytes, found->second.stamp});
}

Result<std::optional<FileStamp>> SimulatedFiles::stamp(const std::string& path) {
  const std::lock_guard lock(mutex_);
  // The caller must not take a file that cannot be read for an unchanged one.
  if (auto fault = readFaults_.of(path)) return *std::move(fault);
  if (directories_.contains(path)) return failure(EISDIR, path);
  const auto found = files_.find(path);
  if (found == files_.end()) return std::optional<FileStamp>();
  return std::optional(found->second.stamp);
}

/// Notes paths as being changed, until `end`. Used with the mutex held.
class SimulatedFiles::Changing {
 public:
  Changing(SimulatedFiles& files, std::vector<std::string> paths) : files_(files), paths_(std::move(paths)) {
    files_.changing_.insert(paths_.begin(), paths_.end());
  }
  ~Changing() { end(); }
  Changing(const Changing&) = delete;
  Changing& operator=(const Changing&) = delete;

  void end() {
    for (const auto& path : std::exchange(paths_, {})) files_.changing_.erase(files_.changing_.find(path));
  }

 private:
  SimulatedFiles& files_;
  std::vector<std::string> paths_;
};

class SimulatedFiles::Replacement : public ReplaceSteps {
 public:
  Replacement(SimulatedFiles& files, const std::string& path)
      : files_(files),
        path_(path),
        temporary_(directoryOf(path) + "/." + path.substr(path.rfind('/') + 1) + std::string(kTemporaryTag) +
                   std::to_string(++files.lastInode_)) {}

  std::optional<Error> createTemporary() override {
    if (auto error = files_.begin(Step::CreateTemporary, path_)) return error;
    files_.store(temporary_, {}, false);
    return std::nullopt;
  }
  std::optional<Error> write(const std::string& bytes) override {
    if (auto error = files_.begin(Step::Write, path_)) return error;
    files_.files_.at(temporary_).setBytes(bytes);
    return std::nullopt;
  }
  std::optional<Error> sync() override {
    if (auto error = files_.begin(Step::Sync, path_)) return error;
    files_.files_.at(temporary_).isSynced = true;
    return std::nullopt;
  }
  std::optional<Error> moveIntoPlace() override {
    if (auto error = files_.begin(Step::Rename, path_)) return error;
    File file = files_.files_.at(temporary_);
    files_.put(path_, std::move(file));
    files_.put(temporary_, std::nullopt);
    return std::nullopt;
  }
  std::optional<Error> syncDirectory() override { return files_.syncDirectoryOf(path_); }
  void removeTemporary() override {
    if (!files_.hasEnded()) files_.put(temporary_, std::nullopt);
  }

 private:
  SimulatedFiles& files_;
  const std::string& path_;
  const std::string temporary_;
};

std::optional<Error> SimulatedFiles::replace(const std::string& path, const std::string& bytes) {
  std::unique_lock lock(mutex_);
  if (auto fault = writeFaultOf(path)) return fault;
  if (directories_.contains(path)) return failure(EISDIR, path);
  if (!directories_.contains(directoryOf(path))) return failure(ENOENT, path);
  removeLeftovers(directoryOf(path));
  Changing changing(*this, {path});
  Replacement steps(*this, path);
  auto error = replaceAtomically(steps, bytes);
  changing.end();
  tellChange(lock, path, !error);
  return error;
}

std::optional<Error> SimulatedFiles::createDirectory(const std::string& path) {
  const std::lock_guard lock(mutex_);
  if (directories_.contains(path)) return std::nullopt;
  if (auto fault = writeFaultOf(path)) return fault;
  for (std::string part = path; part != "/"; part = directoryOf(part)) {
    if (files_.contains(part)) return failure(ENOTDIR, part);
  }
  addDirectories(path);
  return std::nullopt;
}

std::optional<Error> SimulatedFiles::remove(const std::string& path) {
  std::unique_lock lock(mutex_);
  if (auto fault = writeFaultOf(path)) return fault;
  if (directories_.contains(path)) return failure(EISDIR, path);
  if (!files_.contains(path)) return failure(ENOENT, path);
  Changing changing(*this, {path});
  if (auto error = begin(Step::Remove, path)) return error;
  put(path, std::optional<File>());
  auto error = syncDirectoryOf(path);
  changing.end();
  tellChange(lock, path, !error);
  return error;
}

std::optional<Error> SimulatedFiles::rename(const std::string& from, const std::string& to) {
  return move(from, to, true);
}

std::optional<Error> SimulatedFiles::renameToUnused(const std::string& from, const std::string& to) {
  return move(from, to, false);
}

std::optional<Error> SimulatedFiles::move(const std::string& from, const std::string& to, bool replaces) {
  std::unique_lock lock(mutex_);
  if (auto fault = writeFaultOf(from)) return fault;
  if (auto fault = writeFaultOf(to)) return fault;
  if (!files_.contains(from)) return failure(directories_.contains(from) ? EISDIR : ENOENT, from);
  if (!replaces && (files_.contains(to) || directories_.contains(to))) return failure(EEXIST, to);
  if (directories_.contains(to)) return failure(EISDIR, to);
  if (!directories_.contains(directoryOf(to))) return failure(ENOENT, to);
  Changing changing(*this, {from, to});
  if (auto error = begin(Step::Rename, to)) return error;
  if (from == to) return std::nullopt;
  const auto found = files_.find(from);
  if (found == files_.end()) return failure(ENOENT, from);
  File file = found->second;
  file.stamp.changedNanoseconds = nanoseconds(clock_.now());
  put(to, std::move(file));
  put(from, std::optional<File>());
  auto error = syncDirectoryOf(to);
  changing.end();
  tellChange(lock, from, !error);
  tellChange(lock, to, !error);
  return error;
}

std::unique_ptr<FileLock> SimulatedFiles::lock(const std::string& directory) {
  static_cast<void>(createDirectory(directory));
  std::unique_lock own(mutex_);
  auto& turns = locks_[directory];
  if (!turns) turns = queues_ != nullptr ? queues_->newTurns(directory) : std::make_shared<ThreadTurns>();
  const auto taken = turns;
  own.unlock();
  return std::make_unique<Lock>(taken);
}

void SimulatedFiles::put(const std::string& path, std::string bytes) {
  const std::lock_guard lock(mutex_);
  addDirectories(directoryOf(path));
  store(path, std::move(bytes), true);
}

void SimulatedFiles::putPropertyList(const std::string& path, const Value& tree) {
  auto bytes = writePropertyList(tree, PropertyListEncoding::Binary);
  if (!bytes) throw std::invalid_argument(bytes.error().message);
  put(path, *std::move(bytes));
}

std::optional<std::string> SimulatedFiles::get(const std::string& path) const {
  const std::lock_guard lock(mutex_);
  const auto found = files_.find(path);
  if (found == files_.end()) return std::nullopt;
  return found->second.bytes;
}

Value SimulatedFiles::getPropertyList(const std::string& path) const {
  const std::lock_guard lock(mutex_);
  const auto found = files_.find(path);
  if (found == files_.end()) return {};
  const auto& tree = found->second.propertyList();
  return tree ? *tree : Value();
}

bool SimulatedFiles::holdsPropertyList(const std::string& path) const {
  const std::lock_guard lock(mutex_);
  const auto found = files_.find(path);
  return found != files_.end() && found->second.propertyList();
}

void SimulatedFiles::erase(const std::string& path) {
  const std::lock_guard lock(mutex_);
  files_.erase(path);
}

std::vector<std::string> SimulatedFiles::list(const std::string& directory, std::string_view part) const {
  const std::lock_guard lock(mutex_);
  const std::string prefix = directory + "/";
  std::vector<std::string> paths;
  for (auto at = files_.lower_bound(prefix); at != files_.end() && at->first.starts_with(prefix); ++at) {
    if (at->first.find(part) != std::string::npos) paths.push_back(at->first);
  }
  return paths;
}

// Steps; with the mutex held, which `begin` releases while others run.

std::optional<Error> SimulatedFiles::begin(Step step, const std::string& path) {
  if (queues_ != nullptr) {
    mutex_.unlock();
    queues_->mayPause();
    mutex_.lock();
  }
  if (hasEnded()) return failure(EIO, path);
  if (stepFault_) {
    if (auto fault = stepFault_(step, path)) return fault;
  }
  ++steps_;
  return std::nullopt;
}

std::optional<Error> SimulatedFiles::syncDirectoryOf(const std::string& path) {
  if (auto error = begin(Step::SyncDirectory, path)) return error;
  const auto directory = directoryOf(path);
  std::erase_if(unsynced_, [&](const Unsynced& change) { return directoryOf(change.path) == directory; });
  return std::nullopt;
}

/// Without a new file, removes the old one.
void SimulatedFiles::put(const std::string& path, std::optional<File> file) {
  const auto found = files_.find(path);
  unsynced_.push_back({path, found == files_.end() ? std::nullopt : std::optional(found->second)});
  if (file) {
    files_.insert_or_assign(path, *std::move(file));
  } else if (found != files_.end()) {
    files_.erase(found);
  }
}

/// Done once per directory and process, before the first file there is replaced.
void SimulatedFiles::removeLeftovers(const std::string& directory) {
  if (!swept_.insert(directory).second) return;
  const std::string prefix = directory + "/.";
  std::vector<std::string> leftovers;
  for (auto at = files_.lower_bound(prefix); at != files_.end() && at->first.starts_with(prefix); ++at) {
    if (at->first.find(kTemporaryTag) != std::string::npos) leftovers.push_back(at->first);
  }
  for (const auto& path : leftovers) {
    if (!begin(Step::Remove, path)) put(path, std::optional<File>());
  }
}

void SimulatedFiles::tellChange(std::unique_lock<std::mutex>& lock, const std::string& path, bool isDone) {
  if (!changed_) return;
  const auto changed = changed_;
  lock.unlock();
  changed(path, isDone);
  lock.lock();
}

std::optional<Error> SimulatedFiles::writeFaultOf(const std::string& path) const {
  if (hasEnded()) return failure(EIO, path);
  return writeFaults_.of(path);
}

std::size_t SimulatedFiles::readCount() const {
  const std::lock_guard lock(mutex_);
  return reads_;
}

/// Every new content gets a new inode, so that its stamp differs from all others at once.
void SimulatedFiles::store(const std::string& path, std::string bytes, bool isSynced) {
  const auto now = nanoseconds(clock_.now());
  const FileStamp stamp{1, ++lastInode_, bytes.size(), now, now, true};
  File file{std::move(bytes), stamp, isSynced};
  if (isSynced) {
    files_.insert_or_assign(path, std::move(file));
  } else {
    put(path, std::move(file));
  }
}

void SimulatedFiles::addDirectories(std::string path) {
  while (directories_.insert(path).second && path != "/") path = directoryOf(path);
}

}  // namespace kvr
