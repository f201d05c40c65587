#include "platform/stores/PropertyListFiles.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstdio>
#include <utility>

namespace kvr {
namespace {

/// Size of the cache of parsed files, counted in bytes of the files.
constexpr std::uint64_t kRememberedBytes = 4ULL * 1024 * 1024;
constexpr std::size_t kMaximumReports = 256;
/// How often to read a damaged file that changes before it can be set aside.
constexpr int kAttempts = 5;
constexpr int kMaximumSameNames = 1000;

std::string directoryOf(const std::string& path) {
  const auto slash = path.rfind('/');
  return slash == std::string::npos || slash == 0 ? "/" : path.substr(0, slash);
}

bool sameContent(FileStamp left, FileStamp right) {
  left.settled = right.settled = true;
  return left == right;
}

std::optional<Error> complaintAbout(const Result<Value>& outcome, PropertyListFiles::Expected expected) {
  if (!outcome) return outcome.error();
  if (expected == PropertyListFiles::Expected::Dictionary) {
    if (outcome->isDictionary()) return std::nullopt;
    return Error{"plist", 0, "the top level is not a dictionary"};
  }
  if (outcome->isArray()) return std::nullopt;
  return Error{"plist", 0, "the top level is not an array"};
}

/// "20261124T160443Z"
std::string compactTime(Date date) {
  constexpr double kLastSecond = 253402300799;  // of the year 9999
  const double seconds = std::isfinite(date.secondsSince1970) ? date.secondsSince1970 : 0;
  const auto time = calendarTime(static_cast<long long>(std::floor(std::clamp(seconds, 0.0, kLastSecond))));
  char text[80];
  std::snprintf(text, sizeof text, "%04lld%02d%02dT%02d%02d%02dZ", time.year, time.month, time.day, time.hour,
                time.minute, time.second);
  return text;
}

}  // namespace

thread_local PropertyListFiles::Look* PropertyListFiles::Look::current = nullptr;

PropertyListFiles::Look::Look(const PropertyListFiles& lists) : lists_(lists) {
  if (current == nullptr) current = this;
}

PropertyListFiles::Look::~Look() {
  if (current == this) current = nullptr;
}

PropertyListFiles::PropertyListFiles(Files& files, const Clock& clock, Log& log)
    : files_(files), clock_(clock), log_(log) {}

Result<Value> PropertyListFiles::read(const std::string& path, Expected expected, WhenDamaged whenDamaged,
                                      const Complaint& complaintOfReader) {
  for (int attempt = 0; attempt < kAttempts; ++attempt) {
    const auto parsed = attempt == 0 ? parseOnce(path) : parse(path);
    if (!parsed) return reportUnreadable(path, parsed.error());
    if (!*parsed) {
      forget(path);
      noteSound(path);
      return Value();
    }
    const auto& [stamp, outcome] = **parsed;
    auto complaint = complaintAbout(outcome, expected);
    if (!complaint && complaintOfReader) complaint = complaintOfReader(*outcome);
    if (!complaint) {
      noteSound(path);
      return *outcome;
    }
    if (whenDamaged == WhenDamaged::Leave) {
      if (isNews(path, complaint->message, stamp)) {
        log_.error("%s is damaged and counts as missing: %s", path, complaint->message);
      }
      return Value();
    }
    if (auto result = setAside(path, *complaint, stamp)) return *std::move(result);
  }
  return reportUnreadable(path, Error{"files", EBUSY, "it is damaged and keeps changing"});
}

std::optional<Error> PropertyListFiles::write(const std::string& path, const Value& tree,
                                              PropertyListEncoding encoding) {
  Look::current = nullptr;
  if (auto error = files_.createDirectory(directoryOf(path))) return error;
  const auto bytes = writePropertyList(tree, encoding);
  if (!bytes) return bytes.error();
  if (bytes->size() > kLimit) return Error{"files", EFBIG, path + ": too large to be written"};
  if (auto error = files_.replace(path, *bytes)) return error;
  forget(path);
  return std::nullopt;
}

std::unique_ptr<FileLock> PropertyListFiles::lock(const std::string& directory) {
  Look::current = nullptr;
  return files_.lock(directory);
}

/// The parsed file: from this thread's snapshot if it holds the file, otherwise from disk.
Result<std::optional<PropertyListFiles::Parsed>> PropertyListFiles::parseOnce(const std::string& path) {
  auto* const look = Look::current;
  if (look == nullptr || &look->lists_ != this) return parse(path);
  const auto seen = look->seen_.find(path);
  if (seen != look->seen_.end()) return seen->second;
  auto parsed = parse(path);
  if (parsed) look->seen_.emplace(path, *parsed);
  return parsed;
}

/// The file as it is now, from the cache if it is unchanged; nothing when there is none.
Result<std::optional<PropertyListFiles::Parsed>> PropertyListFiles::parse(const std::string& path) {
  if (const auto stamp = files_.stamp(path)) {
    if (!*stamp) return std::optional<Parsed>();
    if (auto parsed = remembered(path, **stamp)) return parsed;
  }
  const auto contents = files_.read(path, kLimit);
  if (!contents) {
    forget(path);
    return contents.error();
  }
  if (!*contents) return std::optional<Parsed>();
  Parsed parsed{(*contents)->stamp, readPropertyList((*contents)->bytes)};
  remember(path, parsed);
  return std::optional(std::move(parsed));
}

std::optional<PropertyListFiles::Parsed> PropertyListFiles::remembered(const std::string& path,
                                                                       const FileStamp& stamp) {
  const std::lock_guard lock(mutex_);
  const auto found = remembered_.find(path);
  if (found == remembered_.end() || found->second.parsed.stamp != stamp) return std::nullopt;
  byAge_.splice(byAge_.end(), byAge_, found->second.age);
  return found->second.parsed;
}

void PropertyListFiles::remember(const std::string& path, const Parsed& parsed) {
  const std::lock_guard lock(mutex_);
  forgetWhileLocked(path);
  if (!parsed.stamp.settled || parsed.stamp.size > kRememberedBytes) return;
  while (rememberedBytes_ + parsed.stamp.size > kRememberedBytes) {
    const auto oldest = byAge_.front();
    forgetWhileLocked(oldest);
  }
  byAge_.push_back(path);
  remembered_.emplace(path, Remembered{parsed, std::prev(byAge_.end())});
  rememberedBytes_ += parsed.stamp.size;
}

void PropertyListFiles::forget(const std::string& path) {
  const std::lock_guard lock(mutex_);
  forgetWhileLocked(path);
}

void PropertyListFiles::forgetWhileLocked(const std::string& path) {
  const auto found = remembered_.find(path);
  if (found == remembered_.end()) return;
  rememberedBytes_ -= found->second.parsed.stamp.size;
  byAge_.erase(found->second.age);
  remembered_.erase(found);
}

/// Renames a damaged file within its directory. Returns nothing if the file has changed since it was found
/// damaged. The lock keeps other writers that use it from changing the file between this check and the
/// renaming.
std::optional<Result<Value>> PropertyListFiles::setAside(const std::string& path, const Error& reason,
                                                         const FileStamp& stamp) {
  const auto fileLock = lock(directoryOf(path));
  const auto now = files_.stamp(path);
  if (!now || !*now || !sameContent(**now, stamp)) return std::nullopt;
  const std::string base = path + ".damaged-" + compactTime(clock_.now());
  std::string name = base;
  std::optional<Error> error = files_.renameToUnused(path, name);
  for (int number = 2; error && error->code == EEXIST && number < kMaximumSameNames; ++number) {
    name = base + "-" + std::to_string(number);
    error = files_.renameToUnused(path, name);
  }
  if (error) {
    return reportUnreadable(path,
                            Error{error->domain, error->code,
                                  "damaged (" + reason.message + "), and not set aside: " + error->message});
  }
  log_.error("%s is damaged (%s): set aside as %s", path, reason.message, name);
  forget(path);
  noteSound(path);
  return Value();
}

Error PropertyListFiles::reportUnreadable(const std::string& path, const Error& error) {
  if (isNews(path, describe(error), {})) log_.error("%s cannot be read: %@", path, error);
  return error;
}

/// Whether this complaint about a file differs from the last one, so that each is logged once.
bool PropertyListFiles::isNews(const std::string& path, const std::string& complaint,
                               const FileStamp& stamp) {
  const std::lock_guard lock(mutex_);
  const auto found = reported_.find(path);
  if (found != reported_.end() && found->second.complaint == complaint &&
      sameContent(found->second.stamp, stamp)) {
    return false;
  }
  if (reported_.size() >= kMaximumReports) reported_.clear();
  reported_.insert_or_assign(path, Report{complaint, stamp});
  return true;
}

void PropertyListFiles::noteSound(const std::string& path) {
  const std::lock_guard lock(mutex_);
  reported_.erase(path);
}

}  // namespace kvr
