#include "platform/simulated/SimulatedFiles.h"

#include "platform/PropertyList.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace kvr {
namespace {

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
  explicit Lock(std::recursive_mutex& mutex) : lock_(mutex) {}

 private:
  const std::lock_guard<std::recursive_mutex> lock_;
};

}  // namespace

void SimulatedFiles::Faults::set(const std::string& path, std::optional<Error> error) {
  if (error) {
    byPath.insert_or_assign(path, *std::move(error));
  } else {
    byPath.erase(path);
  }
}

std::optional<Error> SimulatedFiles::Faults::of(const std::string& path) const {
  const auto found = byPath.find(path);
  return found == byPath.end() ? all : found->second;
}

SimulatedFiles::SimulatedFiles(const Clock& clock) : clock_(clock) { addDirectories(kHomeDirectory); }

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

std::optional<FileStamp> SimulatedFiles::stamp(const std::string& path) {
  const std::lock_guard lock(mutex_);
  // A file that cannot be read must not be taken for an unchanged one.
  if (readFaults_.of(path)) return std::nullopt;
  const auto found = files_.find(path);
  if (found == files_.end()) return std::nullopt;
  return found->second.stamp;
}

std::optional<Error> SimulatedFiles::replace(const std::string& path, const std::string& bytes) {
  const std::lock_guard lock(mutex_);
  if (auto fault = writeFaultOf(path)) return fault;
  if (directories_.contains(path)) return failure(EISDIR, path);
  if (!directories_.contains(directoryOf(path))) return failure(ENOENT, path);
  store(path, bytes);
  ++writes_;
  return std::nullopt;
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
  const std::lock_guard lock(mutex_);
  if (auto fault = writeFaultOf(path)) return fault;
  if (directories_.contains(path)) return failure(EISDIR, path);
  if (files_.erase(path) == 0) return failure(ENOENT, path);
  ++writes_;
  return std::nullopt;
}

std::optional<Error> SimulatedFiles::rename(const std::string& from, const std::string& to) {
  return move(from, to, true);
}

std::optional<Error> SimulatedFiles::renameToUnused(const std::string& from, const std::string& to) {
  return move(from, to, false);
}

std::optional<Error> SimulatedFiles::move(const std::string& from, const std::string& to, bool replaces) {
  const std::lock_guard lock(mutex_);
  if (auto fault = writeFaultOf(from)) return fault;
  if (auto fault = writeFaultOf(to)) return fault;
  const auto found = files_.find(from);
  if (found == files_.end()) return failure(directories_.contains(from) ? EISDIR : ENOENT, from);
  if (!replaces && (files_.contains(to) || directories_.contains(to))) return failure(EEXIST, to);
  if (directories_.contains(to)) return failure(EISDIR, to);
  if (!directories_.contains(directoryOf(to))) return failure(ENOENT, to);
  ++writes_;
  if (from == to) return std::nullopt;
  File file = std::move(found->second);
  files_.erase(found);
  file.stamp.changedNanoseconds = nanoseconds(clock_.now());
  files_.insert_or_assign(to, std::move(file));
  return std::nullopt;
}

std::unique_ptr<FileLock> SimulatedFiles::lock(const std::string& directory) {
  static_cast<void>(createDirectory(directory));
  std::unique_lock own(mutex_);
  auto& mutex = locks_[directory];
  own.unlock();
  return std::make_unique<Lock>(mutex);
}

void SimulatedFiles::put(const std::string& path, std::string bytes) {
  const std::lock_guard lock(mutex_);
  addDirectories(directoryOf(path));
  store(path, std::move(bytes));
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
  const auto bytes = get(path);
  if (!bytes) return {};
  auto tree = readPropertyList(*bytes);
  return tree ? *std::move(tree) : Value();
}

void SimulatedFiles::erase(const std::string& path) {
  const std::lock_guard lock(mutex_);
  files_.erase(path);
}

std::vector<std::string> SimulatedFiles::list(const std::string& directory) const {
  const std::lock_guard lock(mutex_);
  const std::string prefix = directory + "/";
  std::vector<std::string> paths;
  for (auto at = files_.lower_bound(prefix); at != files_.end() && at->first.starts_with(prefix); ++at) {
    paths.push_back(at->first);
  }
  return paths;
}

void SimulatedFiles::setReadFault(std::optional<Error> error) {
  const std::lock_guard lock(mutex_);
  readFaults_.all = std::move(error);
}

void SimulatedFiles::setReadFault(const std::string& path, std::optional<Error> error) {
  const std::lock_guard lock(mutex_);
  readFaults_.set(path, std::move(error));
}

void SimulatedFiles::setWriteFault(std::optional<Error> error) {
  const std::lock_guard lock(mutex_);
  writeFaults_.all = std::move(error);
}

void SimulatedFiles::setWriteFault(const std::string& path, std::optional<Error> error) {
  const std::lock_guard lock(mutex_);
  writeFaults_.set(path, std::move(error));
}

void SimulatedFiles::killAfterWrites(std::size_t count) {
  const std::lock_guard lock(mutex_);
  lastWrite_ = writes_ + count;
}

bool SimulatedFiles::isKilled() const {
  const std::lock_guard lock(mutex_);
  return lastWrite_ && writes_ >= *lastWrite_;
}

void SimulatedFiles::takeOver(const SimulatedFiles& other) {
  const std::scoped_lock lock(mutex_, other.mutex_);
  files_ = other.files_;
  directories_ = other.directories_;
  lastInode_ = other.lastInode_;
}

std::optional<Error> SimulatedFiles::writeFaultOf(const std::string& path) const {
  if (lastWrite_ && writes_ >= *lastWrite_) return failure(EIO, path);
  return writeFaults_.of(path);
}

std::size_t SimulatedFiles::writeCount() const {
  const std::lock_guard lock(mutex_);
  return writes_;
}

std::size_t SimulatedFiles::readCount() const {
  const std::lock_guard lock(mutex_);
  return reads_;
}

/// Every content gets an inode of its own, so that its stamp tells it from all others at once.
void SimulatedFiles::store(const std::string& path, std::string bytes) {
  const auto now = nanoseconds(clock_.now());
  const FileStamp stamp{1, ++lastInode_, bytes.size(), now, now, true};
  files_.insert_or_assign(path, File{std::move(bytes), stamp});
}

void SimulatedFiles::addDirectories(std::string path) {
  while (directories_.insert(path).second && path != "/") path = directoryOf(path);
}

}  // namespace kvr
