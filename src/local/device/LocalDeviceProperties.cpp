#include "local/device/LocalDeviceProperties.h"

#include <unistd.h>

#include <algorithm>
#include <array>

namespace kvr {
namespace {

constexpr std::string_view kFile = "DeviceProperties.plist";
constexpr std::string_view kInternalInstall = "InternalInstall";
constexpr std::size_t kLimit = 64UL * 1024;
constexpr std::string_view kBlanks("\0 \t\r\n", 5);

std::string_view trimmed(std::string_view text) {
  const auto first = text.find_first_not_of(kBlanks);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

/// A text from the firmware, unless it is one of the placeholders that manufacturers leave in.
std::optional<std::string> factIn(std::string_view text) {
  static constexpr std::array kFillers{"none",
                                       "default string",
                                       "not specified",
                                       "unknown",
                                       "system serial number",
                                       "system product name",
                                       "to be filled by o.e.m.",
                                       "not applicable",
                                       "0"};
  text = trimmed(text);
  const auto isPrintable = [](char c) { return c >= ' ' && c <= '~'; };
  if (text.empty() || !std::ranges::all_of(text, isPrintable)) return std::nullopt;
  std::string folded(text);
  std::ranges::transform(folded, folded.begin(),
                         [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; });
  if (std::ranges::find(kFillers, folded) != kFillers.end()) return std::nullopt;
  return std::string(text);
}

/// The value of a variable in an os-release file: from its last assignment, with or without quotes.
std::optional<std::string> variable(std::string_view text, std::string_view name) {
  std::optional<std::string> found;
  while (!text.empty()) {
    const auto end = std::min(text.find('\n'), text.size());
    std::string_view line = trimmed(text.substr(0, end));
    text.remove_prefix(std::min(end + 1, text.size()));
    if (!line.starts_with(name) || line.substr(name.size(), 1) != "=") continue;
    line.remove_prefix(name.size() + 1);
    if (line.size() >= 2 && (line.front() == '"' || line.front() == '\'') && line.back() == line.front()) {
      line = line.substr(1, line.size() - 2);
    }
    found = factIn(line);
  }
  return found;
}

std::optional<std::string> hostName() {
  std::array<char, 256> name{};
  if (::gethostname(name.data(), name.size() - 1) != 0) return std::nullopt;
  return factIn(name.data());
}

}  // namespace

std::optional<std::string> LocalDeviceProperties::answer(std::string_view question) const {
  static constexpr std::array kQuestions{kSerialNumber, kUserAssignedDeviceName, kProductType,
                                         kProductVersion};
  if (std::ranges::find(kQuestions, question) == kQuestions.end()) return std::nullopt;
  auto stated = root_.dictionary(kFile)[question].stringIfAny();
  return stated ? stated : hostAnswer(question);
}

bool LocalDeviceProperties::isInternalInstall() const {
  const auto tree = root_.dictionary(kFile);
  const auto& flag = tree[kInternalInstall];
  return flag.isBool() && flag.boolean();
}

std::optional<std::string> LocalDeviceProperties::hostAnswer(std::string_view question) const {
  if (question == kSerialNumber) {
    return firstFact({"/sys/class/dmi/id/product_serial", "/proc/device-tree/serial-number"});
  }
  if (question == kProductType) {
    return firstFact({"/sys/class/dmi/id/product_name", "/proc/device-tree/model"});
  }
  if (question == kUserAssignedDeviceName) return hostName();
  // Only the first of the two files that exists counts, whatever it contains.
  auto release = textOf("/etc/os-release");
  if (!release) release = textOf("/usr/lib/os-release");
  return release ? variable(*release, "VERSION_ID") : std::nullopt;
}

std::optional<std::string> LocalDeviceProperties::firstFact(std::initializer_list<const char*> paths) const {
  for (const auto* path : paths) {
    const auto text = textOf(path);
    if (!text) continue;
    if (auto fact = factIn(*text)) return fact;
  }
  return std::nullopt;
}

std::optional<std::string> LocalDeviceProperties::textOf(const char* path) const {
  const auto contents = root_.lists().files().read(systemRoot_ + path, kLimit);
  if (!contents || !*contents) return std::nullopt;
  return (*contents)->bytes;
}

}  // namespace kvr
