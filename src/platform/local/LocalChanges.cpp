#include "platform/local/LocalChanges.h"

#include <algorithm>
#include <fstream>
#include <iterator>
#include <utility>

namespace kvr {
namespace {

constexpr double kSettling = 0.1;  // seconds

bool containsAll(const std::set<std::string>& whole, const std::set<std::string>& part) {
  return std::ranges::includes(whole, part);
}

}  // namespace

LocalChanges::LocalChanges(EventLoop& loop, Log& log, const DeviceRoot& root, const LocalUserLocale& locale,
                           const LocalPairedDeviceRegistry& pairedDevices, LocalNotifications& notifications,
                           const std::vector<std::string>& hostLocale)
    : locale_(locale),
      pairedDevices_(pairedDevices),
      notifications_(notifications),
      hostLocale_(hostLocale),
      loop_(loop),
      language_(languageNow()),
      watches_(watchesNow()) {
  std::vector<std::string> paths = hostLocale_;
  paths.push_back(root.pathOf("Locale.plist"));
  paths.push_back(root.pathOf("PairedDevices.plist"));
  for (const auto& path : paths) {
    fileWatches_.push_back(std::make_unique<FileWatch>(loop, log, path, [this] { noticeSoon(); }));
  }
}

std::string LocalChanges::languageNow() const {
  std::string language = locale_.preferredIdentifier();
  if (locale_.isStatedByDevice()) return language;
  for (const auto& path : hostLocale_) {
    std::ifstream file(path);
    language.append("\n").append(std::istreambuf_iterator<char>(file), {});
  }
  return language;
}

std::set<std::string> LocalChanges::watchesNow() const {
  const auto paired = pairedDevices_.allDevicesPassing([](const PairedDeviceEntry& entry) {
    return entry.isPaired.value_or(false) && !entry.isArchived.value_or(false);
  });
  std::set<std::string> watches;
  for (const auto& entry : paired) watches.insert(entry.serialNumber.value_or(entry.name.value_or("")));
  return watches;
}

void LocalChanges::noticeSoon() {
  if (std::exchange(isNoticing_, true)) return;
  loop_.after(kSettling, [this] { notice(); });
}

void LocalChanges::notice() {
  isNoticing_ = false;
  const auto watches = std::exchange(watches_, watchesNow());
  if (!containsAll(watches, watches_)) notifications_.post(PairedDeviceRegistry::kDeviceDidPair);
  if (!containsAll(watches_, watches)) notifications_.post(PairedDeviceRegistry::kDeviceDidUnpair);
  if (std::exchange(language_, languageNow()) != language_) notifications_.post(UserLocale::kLanguageChanged);
}

}  // namespace kvr
