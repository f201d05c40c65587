#include "local/system/LocalFiles.h"

#include "local/system/Descriptor.h"
#include "platform/stores/AtomicReplace.h"

#include <dirent.h>
#include <fcntl.h>
#include <pwd.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <system_error>
#include <utility>

namespace kvr {
namespace {

constexpr std::string_view kTemporaryTag = ".kvr-";
constexpr std::string_view kTemporaryTemplate = "XXXXXX";
/// How old a file's times must be for its stamp to count as settled: they follow a clock that ticks every few
/// ms only.
constexpr std::int64_t kSettlingNanoseconds = 50'000'000;
constexpr int kAttempts = 10;

Error failure(int code, const std::string& path) {
  return {"files", code, path + ": " + std::generic_category().message(code)};
}

Error failure(const std::string& path) { return failure(errno, path); }

/// Why a path is not acceptable as a file name, if it is not.
std::optional<Error> objectionTo(const std::string& path) {
  if (path.starts_with('/') && path.find('\0') == std::string::npos) return std::nullopt;
  return Error{"files", EINVAL, "not an absolute path: " + path.substr(0, path.find('\0'))};
}

/// Only regular files are read or replaced.
std::optional<Error> objectionToKind(const struct stat& status, const std::string& path) {
  if (S_ISREG(status.st_mode)) return std::nullopt;
  return S_ISDIR(status.st_mode) ? failure(EISDIR, path)
                                 : Error{"files", EINVAL, path + ": not a regular file"};
}

/// Whether an error code means that there is no such file.
bool isMissing(int code) { return code == ENOENT || code == ENOTDIR; }

std::string directoryOf(const std::string& path) {
  const auto slash = path.rfind('/');
  return slash == 0 ? "/" : path.substr(0, slash);
}

std::int64_t nanoseconds(const timespec& time) { return time.tv_sec * 1'000'000'000LL + time.tv_nsec; }

/// By the clock that file times are taken from.
std::int64_t fileTimeNow() {
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME_COARSE, &now);
  return nanoseconds(now);
}

/// `asked` is the file time just before the status was asked for.
FileStamp stampOf(const struct stat& status, std::int64_t asked) {
  const auto modified = nanoseconds(status.st_mtim);
  const auto changed = nanoseconds(status.st_ctim);
  return {status.st_dev, status.st_ino, static_cast<std::uint64_t>(status.st_size),
          modified,      changed,       std::max(modified, changed) < asked - kSettlingNanoseconds};
}

/// Opens without waiting (for a writer of a FIFO, a line of a terminal), whatever bears the name.
Descriptor openExisting(const std::string& path, int flags) {
  int descriptor = -1;
  do {
    descriptor = ::open(path.c_str(), flags | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
  } while (descriptor < 0 && errno == EINTR);
  return Descriptor(descriptor);
}

/// Reads to the end. The size of `bytes` is the first guess at what there is: one more than a file's size
/// lets the second call find the end.
std::optional<Error> readAll(int descriptor, std::string& bytes, std::size_t limit, const std::string& path) {
  constexpr std::size_t kMost = 1UL << 20U;  // bytes per step
  constexpr std::size_t kLeast = 4096;
  std::size_t used = 0;
  while (true) {
    if (bytes.size() == used) bytes.resize(std::min(limit + 1, used + std::min(kMost, used + kLeast)));
    const auto count = ::read(descriptor, bytes.data() + used, bytes.size() - used);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return failure(path);
    used += static_cast<std::size_t>(count);
    if (used > limit) return failure(EFBIG, path);
    if (count == 0) break;
  }
  bytes.resize(used);
  return std::nullopt;
}

/// Makes a directory's entries durable. A file system without that operation counts as successful.
std::optional<Error> syncDirectory(const std::string& directory) {
  const auto descriptor = openExisting(directory, O_RDONLY | O_DIRECTORY);
  if (!descriptor) return failure(directory);
  if (::fsync(descriptor.get()) != 0 && errno != EINVAL && errno != ENOTSUP) return failure(directory);
  return std::nullopt;
}

/// Locks a temporary file to mark it as in use. False when somebody removed the file meanwhile.
bool hold(int descriptor) {
  while (::flock(descriptor, LOCK_EX) != 0 && errno == EINTR) {
  }
  struct stat status {};
  return ::fstat(descriptor, &status) == 0 && status.st_nlink > 0;
}

/// Creates an empty file beside `path`, mode 0600, locked as in use, and sets `name` to its path.
Result<Descriptor> createTemporary(const std::string& path, std::string& name) {
  constexpr std::size_t kLongestName = 200;  // of the target, so that the temporary name is not too long
  const auto slash = path.rfind('/');
  for (int attempt = 0; attempt < kAttempts; ++attempt) {
    name = path.substr(0, slash + 1) + "." + path.substr(slash + 1, kLongestName);
    name += kTemporaryTag;
    name += kTemporaryTemplate;
    Descriptor descriptor(::mkostemp(name.data(), O_CLOEXEC));
    if (!descriptor) return failure(path);
    if (hold(descriptor.get())) return descriptor;
  }
  return failure(EAGAIN, path);
}

bool isTemporaryName(std::string_view name) {
  const auto tail = kTemporaryTag.size() + kTemporaryTemplate.size();
  return name.starts_with('.') && name.size() > tail + 1 &&
         name.substr(name.size() - tail).starts_with(kTemporaryTag);
}

/// Removes a temporary file that no writer has locked.
void removeIfAbandoned(const std::string& path) {
  const auto descriptor = openExisting(path, O_RDONLY | O_NOFOLLOW);
  struct stat status {};
  if (!descriptor || ::fstat(descriptor.get(), &status) != 0 || !S_ISREG(status.st_mode)) return;
  if (::flock(descriptor.get(), LOCK_EX | LOCK_NB) == 0) ::unlink(path.c_str());
}

/// Why a file cannot replace what is at the path, if it cannot.
std::optional<Error> objectionToReplacing(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) {
    return errno == ENOENT ? std::nullopt : std::optional(failure(path));
  }
  return objectionToKind(status, path);
}

class Replacement : public ReplaceSteps {
 public:
  explicit Replacement(const std::string& path) : path_(path) {}

  std::optional<Error> createTemporary() override {
    auto created = kvr::createTemporary(path_, temporary_);
    if (!created) return created.error();
    descriptor_ = *std::move(created);
    return std::nullopt;
  }
  std::optional<Error> write(const std::string& bytes) override {
    return outcome(writeAll(descriptor_.get(), bytes));
  }
  std::optional<Error> sync() override { return outcome(::fsync(descriptor_.get()) == 0); }
  std::optional<Error> moveIntoPlace() override {
    return outcome(::rename(temporary_.c_str(), path_.c_str()) == 0);
  }
  std::optional<Error> syncDirectory() override { return kvr::syncDirectory(directoryOf(path_)); }
  void removeTemporary() override { isTemporaryLeft_ = ::unlink(temporary_.c_str()) != 0; }

  /// Whether a temporary file could not be removed.
  bool isTemporaryLeft() const { return isTemporaryLeft_; }

 private:
  std::optional<Error> outcome(bool done) const {
    return done ? std::nullopt : std::optional(failure(path_));
  }

  const std::string& path_;
  std::string temporary_;
  Descriptor descriptor_;
  bool isTemporaryLeft_ = false;
};

std::string withoutTrailingSlashes(std::string path) {
  while (path.ends_with('/')) path.pop_back();
  return path;
}

}  // namespace

class LocalFiles::Lock : public FileLock {
 public:
  Lock(LocalFiles& files, DirectoryLock& state) : files_(files), state_(state) {}
  Lock(const Lock&) = delete;
  Lock& operator=(const Lock&) = delete;
  ~Lock() override { files_.unlock(state_); }

 private:
  LocalFiles& files_;
  DirectoryLock& state_;
};

std::string LocalFiles::homeDirectoryOfUser() {
  if (const char* home = std::getenv("HOME"); home != nullptr && home[0] == '/') return home;
  std::string buffer(16384, '\0');
  passwd entry{};
  passwd* found = nullptr;
  if (::getpwuid_r(::getuid(), &entry, buffer.data(), buffer.size(), &found) == 0 && found != nullptr &&
      found->pw_dir != nullptr && found->pw_dir[0] == '/') {
    return found->pw_dir;
  }
  return "/";
}

LocalFiles::LocalFiles(Log& log, std::string homeDirectory, double lockPatience)
    : log_(log),
      homeDirectory_(withoutTrailingSlashes(std::move(homeDirectory))),
      lockPatience_(lockPatience) {}

Result<std::optional<FileContents>> LocalFiles::read(const std::string& path, std::size_t limit) {
  if (auto error = objectionTo(path)) return *std::move(error);
  const auto descriptor = openExisting(path, O_RDONLY);
  if (!descriptor) {
    if (isMissing(errno)) return std::optional<FileContents>();
    return failure(path);
  }
  const auto asked = fileTimeNow();
  struct stat before {};
  if (::fstat(descriptor.get(), &before) != 0) return failure(path);
  if (auto error = objectionToKind(before, path)) return *std::move(error);
  const auto size = static_cast<std::uint64_t>(before.st_size);
  if (size > limit) return failure(EFBIG, path);
  FileContents contents{{}, stampOf(before, asked)};
  contents.bytes.resize(static_cast<std::size_t>(size) + 1);
  if (auto error = readAll(descriptor.get(), contents.bytes, limit, path)) return *std::move(error);
  struct stat after {};
  if (::fstat(descriptor.get(), &after) != 0) return failure(path);
  const auto stamp = stampOf(after, asked);
  if (stamp.modifiedNanoseconds != contents.stamp.modifiedNanoseconds || stamp.size != contents.stamp.size ||
      stamp.changedNanoseconds != contents.stamp.changedNanoseconds) {
    contents.stamp.settled = false;
  }
  return std::optional(std::move(contents));
}

Result<std::optional<FileStamp>> LocalFiles::stamp(const std::string& path) {
  if (auto error = objectionTo(path)) return *std::move(error);
  const auto asked = fileTimeNow();
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) {
    if (isMissing(errno)) return std::optional<FileStamp>();
    return failure(path);
  }
  if (auto error = objectionToKind(status, path)) return *std::move(error);
  return std::optional(stampOf(status, asked));
}

std::optional<Error> LocalFiles::replace(const std::string& path, const std::string& bytes) {
  if (auto error = objectionTo(path)) return error;
  if (auto error = objectionToReplacing(path)) return error;
  removeLeftovers(directoryOf(path));
  Replacement steps(path);
  auto error = replaceAtomically(steps, bytes);
  if (steps.isTemporaryLeft()) {
    const std::lock_guard own(mutex_);
    swept_.erase(directoryOf(path));  // the next change clears it again
  }
  return error;
}

std::optional<Error> LocalFiles::createDirectory(const std::string& path) {
  if (auto error = objectionTo(path)) return error;
  struct stat status {};
  if (::stat(path.c_str(), &status) == 0) {
    return S_ISDIR(status.st_mode) ? std::nullopt : std::optional(failure(ENOTDIR, path));
  }
  for (std::size_t end = path.find('/', 1); true; end = path.find('/', end + 1)) {
    const std::string part = path.substr(0, end);
    if (::mkdir(part.c_str(), 0700) == 0) {
      if (auto error = syncDirectory(directoryOf(part))) return error;
    } else if (const int code = errno; ::stat(part.c_str(), &status) != 0) {
      return failure(code, part);
    } else if (!S_ISDIR(status.st_mode)) {
      return failure(ENOTDIR, part);
    }
    if (end == std::string::npos) return std::nullopt;
  }
}

std::optional<Error> LocalFiles::remove(const std::string& path) {
  if (auto error = objectionTo(path)) return error;
  if (::unlink(path.c_str()) != 0) return failure(path);
  return syncDirectory(directoryOf(path));
}

std::optional<Error> LocalFiles::rename(const std::string& from, const std::string& to) {
  if (auto error = objectionTo(from)) return error;
  if (auto error = objectionTo(to)) return error;
  if (auto error = objectionToReplacing(to)) return error;
  if (::rename(from.c_str(), to.c_str()) != 0) return failure(from);
  return syncDirectory(directoryOf(to));
}

std::optional<Error> LocalFiles::renameToUnused(const std::string& from, const std::string& to) {
  if (auto error = objectionTo(from)) return error;
  if (auto error = objectionTo(to)) return error;
  if (::renameat2(AT_FDCWD, from.c_str(), AT_FDCWD, to.c_str(), RENAME_NOREPLACE) != 0) {
    if (errno != EINVAL && errno != ENOSYS) return failure(errno, errno == EEXIST ? to : from);
    // The file system does not support that. A hard link does not replace an existing file either.
    if (::link(from.c_str(), to.c_str()) != 0) return failure(errno, errno == EEXIST ? to : from);
    if (::unlink(from.c_str()) != 0) return failure(from);
  }
  return syncDirectory(directoryOf(to));
}

std::unique_ptr<FileLock> LocalFiles::lock(const std::string& directory) {
  const auto start = std::chrono::steady_clock::now();
  const auto self = std::this_thread::get_id();
  std::unique_lock own(mutex_);
  auto& state = locks_[directory];
  if (state.depth == 0 || state.owner != self) {
    released_.wait(own, [&state] { return state.depth == 0; });
    state.owner = self;
  }
  if (state.depth++ == 0) {
    own.unlock();
    const std::chrono::duration<double> waited = std::chrono::steady_clock::now() - start;
    lockAgainstOtherProcesses(directory, state, lockPatience_ - waited.count());
  }
  return std::make_unique<Lock>(*this, state);
}

/// While another process holds the lock, only this process's first thread waits for it; later ones try only
/// once, until one succeeds.
void LocalFiles::lockAgainstOtherProcesses(const std::string& directory, DirectoryLock& state,
                                           double patience) {
  std::optional<Error> error = createDirectory(directory);
  Descriptor descriptor;
  if (!error) {
    descriptor = openExisting(directory, O_RDONLY | O_DIRECTORY);
    if (!descriptor) error = failure(directory);
  }
  const auto end =
      std::chrono::steady_clock::now() + std::chrono::duration<double>(state.gaveUp ? 0 : patience);
  auto pause = std::chrono::milliseconds(2);
  while (!error && ::flock(descriptor.get(), LOCK_EX | LOCK_NB) != 0) {
    if (errno == EINTR) continue;
    if (errno != EWOULDBLOCK || std::chrono::steady_clock::now() >= end) {
      error = failure(directory);
      break;
    }
    std::this_thread::sleep_for(pause);
    pause = std::min(2 * pause, std::chrono::milliseconds(50));
  }
  if (!error) {
    state.gaveUp = false;
    state.descriptor = descriptor.release();
  } else if (!std::exchange(state.gaveUp, true)) {
    log_.error("changes in %s are no longer locked against other processes: %@", directory, *error);
  }
}

void LocalFiles::unlock(DirectoryLock& state) {
  const std::lock_guard own(mutex_);
  if (--state.depth > 0) return;
  const Descriptor descriptor(std::exchange(state.descriptor, -1));
  state.owner = {};
  released_.notify_all();
}

void LocalFiles::removeLeftovers(const std::string& directory) {
  {
    const std::lock_guard own(mutex_);
    if (!swept_.insert(directory).second) return;
  }
  const std::unique_ptr<DIR, int (*)(DIR*)> entries(::opendir(directory.c_str()), ::closedir);
  if (!entries) return;
  while (const dirent* entry = ::readdir(entries.get())) {
    if (isTemporaryName(entry->d_name)) removeIfAbandoned(directory + "/" + entry->d_name);
  }
}

}  // namespace kvr
