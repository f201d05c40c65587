// Faults of files, killed processes and lost power.

#include "simulated/SimulatedFiles.h"

#include <utility>

namespace kvr {

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

void SimulatedFiles::setStepFault(StepFault fault) {
  const std::lock_guard lock(mutex_);
  stepFault_ = std::move(fault);
}

void SimulatedFiles::whenChanged(Changed changed) {
  const std::lock_guard lock(mutex_);
  changed_ = std::move(changed);
}

// Ending.

void SimulatedFiles::killAfterSteps(std::size_t count) {
  const std::lock_guard lock(mutex_);
  lastStep_ = steps_ + count;
}

bool SimulatedFiles::isKilled() const {
  const std::lock_guard lock(mutex_);
  return hasEnded();
}

std::set<std::string> SimulatedFiles::changing() const {
  const std::lock_guard lock(mutex_);
  return {changing_.begin(), changing_.end()};
}

bool SimulatedFiles::hasEnded() const { return lastStep_ && steps_ >= *lastStep_; }

void SimulatedFiles::takeOver(const SimulatedFiles& other) {
  const std::scoped_lock lock(mutex_, other.mutex_);
  files_ = other.files_;
  directories_ = other.directories_;
  lastInode_ = other.lastInode_;
  unsynced_ = other.unsynced_;
}

/// Changes of names are kept in order, as on a file system with a journal.
void SimulatedFiles::losePower(std::mt19937_64& random) {
  const std::lock_guard lock(mutex_);
  const auto kept = static_cast<std::size_t>(random() % (unsynced_.size() + 1));
  while (unsynced_.size() > kept) {
    auto& [path, before] = unsynced_.back();
    if (before) {
      files_.insert_or_assign(path, *before);
    } else {
      files_.erase(path);
    }
    unsynced_.pop_back();
  }
  unsynced_.clear();
  for (auto& [path, file] : files_) {
    if (std::exchange(file.isSynced, true)) continue;
    file.setBytes(file.bytes.substr(0, static_cast<std::size_t>(random() % (file.bytes.size() + 1))));
    file.stamp.inode = ++lastInode_;
  }
}

}  // namespace kvr
