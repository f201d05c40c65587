#include "simulated/SimulatedLog.h"

#include <algorithm>

namespace kvr {

std::vector<SimulatedLog::Line> SimulatedLog::lines() const {
  const std::lock_guard lock(mutex_);
  return lines_;
}

std::vector<std::string> SimulatedLog::texts() const {
  std::vector<std::string> texts;
  for (auto& line : lines()) texts.push_back(std::move(line.text));
  return texts;
}

std::vector<std::string> SimulatedLog::texts(LogLevel level) const {
  std::vector<std::string> texts;
  for (auto& line : lines()) {
    if (line.level == level) texts.push_back(std::move(line.text));
  }
  return texts;
}

std::size_t SimulatedLog::count(std::string_view text) const {
  const std::lock_guard lock(mutex_);
  const auto matches = [&](const Line& line) { return line.text == text; };
  return static_cast<std::size_t>(std::count_if(lines_.begin(), lines_.end(), matches));
}

bool SimulatedLog::contains(std::string_view part) const {
  const std::lock_guard lock(mutex_);
  const auto matches = [&](const Line& line) { return line.text.find(part) != std::string::npos; };
  return std::any_of(lines_.begin(), lines_.end(), matches);
}

void SimulatedLog::clear() {
  const std::lock_guard lock(mutex_);
  lines_.clear();
}

void SimulatedLog::keepLast(std::size_t count) {
  const std::lock_guard lock(mutex_);
  kept_ = count;
}

std::vector<std::string> SimulatedLog::faults() const {
  const std::lock_guard lock(mutex_);
  return faults_;
}

std::vector<std::string> SimulatedLog::takeFaults() {
  const std::lock_guard lock(mutex_);
  return std::exchange(faults_, {});
}

void SimulatedLog::reportMisusedCompletion(std::string_view what, std::string_view name) {
  if (!isEnding()) {
    const std::lock_guard lock(mutex_);
    faults_.push_back(format("%s: %s", name, what));
  }
  Log::reportMisusedCompletion(what, name);
}

void SimulatedLog::write(LogLevel level, const std::string& message) {
  const std::lock_guard lock(mutex_);
  lines_.push_back({level, message});
  if (kept_ != 0 && lines_.size() >= 2 * kept_) {
    lines_.erase(lines_.begin(), lines_.end() - static_cast<std::ptrdiff_t>(kept_));
  }
}

}  // namespace kvr
