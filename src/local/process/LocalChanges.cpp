#include "local/process/LocalChanges.h"

#include "platform/names/Names.h"

#include <algorithm>
#include <chrono>
#include <fstream>
#include <iterator>
#include <utility>

namespace kvr {
namespace {

using namespace std::chrono_literals;

constexpr double kSettling = 0.1;  // seconds
constexpr auto kBurst = 1s;        // the longest time between edits that belong together
constexpr const char* kLocale = "Locale.plist";
constexpr const char* kPairedDevices = "PairedDevices.plist";
constexpr const char* kDeviceProperties = "DeviceProperties.plist";

bool containsAll(const std::set<std::string>& whole, const std::set<std::string>& part) {
  return std::ranges::includes(whole, part);
}

}  // namespace

LocalChanges::LocalChanges(EventLoop& loop, Log& log, const DeviceRoot& root, const LocalUserLocale& locale,
                           const LocalPairedDeviceRegistry& pairedDevices, LocalNotifications& notifications,
                           Observers* observers, const std::vector<std::string>& hostLocale)
    : root_(root),
      locale_(locale),
      pairedDevices_(pairedDevices),
      notifications_(notifications),
      observers_(observers),
      hostLocale_(hostLocale),
      loop_(loop),
      language_(languageNow()),
      watches_(watchesNow()),
      devices_(devicesNow()),
      localeFile_{kLocale, &LocalChanges::tellLocale, 0, stampOf(kLocale)},
      watchesFile_{kPairedDevices, &LocalChanges::tellWatches, 0, stampOf(kPairedDevices)} {
  const auto watch = [&](const std::string& path, FileWatch::Changed changed) {
    fileWatches_.push_back(std::make_unique<FileWatch>(loop, log, path, std::move(changed)));
  };
  for (const auto& path : hostLocale_) {
    watch(path, [this](std::size_t) { lookLater(localeFile_); });
  }
  watch(root.pathOf(kLocale), [this](std::size_t writes) {
    handleEdit(localeFile_, writes, writes > 0 && root_.dictionary(kLocale).isDictionary());
  });
  watch(root.pathOf(kPairedDevices), [this](std::size_t writes) {
    tellDevices();
    handleEdit(watchesFile_, writes, writes > 0 && root_.array(kPairedDevices).isArray());
  });
  if (observers_) watch(root.pathOf(kDeviceProperties), [this](std::size_t) { tellDevices(); });
}

Value LocalChanges::devicesNow() const {
  if (!observers_) return {};
  return Value::Array{root_.dictionary(kDeviceProperties), root_.array(kPairedDevices)};
}

void LocalChanges::tellDevices() {
  Value now = devicesNow();
  if (now == devices_) return;
  devices_ = std::move(now);
  observers_->tell({{}, {}, true});
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

std::optional<FileStamp> LocalChanges::stampOf(const char* file) const {
  auto stamp = root_.stamp(file);
  if (stamp) stamp->settled = false;  // it changes by the passing of time alone
  return stamp;
}

/// The file may have been written again before it is read. The first of two quick edits then reads both, and
/// the second reads the same version again.
void LocalChanges::handleEdit(Subject& subject, std::size_t writes, bool isWhole) {
  const auto now = Clock::now();
  if (now - std::exchange(subject.lastEdit, now) > kBurst) subject.edits = 0;
  subject.edits += writes;
  const bool isSeen = stampOf(subject.file) == subject.seen;
  if (!isWhole) {
    lookLater(subject);
  } else if ((this->*subject.tell)(subject.edits, isSeen)) {
    subject.edits = 0;
  }
  subject.seen = stampOf(subject.file);
}

void LocalChanges::lookLater(Subject& subject) {
  if (std::exchange(subject.isLookToCome, true)) return;
  loop_.after(kSettling, [this, &subject] {
    subject.isLookToCome = false;
    if ((this->*subject.tell)(std::max<std::size_t>(subject.edits, 1), false)) subject.edits = 0;
    subject.seen = stampOf(subject.file);
  });
}

bool LocalChanges::tellLocale(std::size_t edits, bool isCertain) {
  const bool isChanged = std::exchange(language_, languageNow()) != language_;
  if (!isChanged && !isCertain && edits < 2) return false;
  post(names::kLanguageChanged, edits);
  return true;
}

bool LocalChanges::tellWatches(std::size_t edits, bool isCertain) {
  const auto watches = std::exchange(watches_, watchesNow());
  const bool arePaired = !containsAll(watches, watches_);
  const bool areUnpaired = !containsAll(watches_, watches);
  const bool isChanged = arePaired || areUnpaired;
  if (!isChanged && !isCertain && edits < 2) return false;
  // Edits that cancel each other out are pairings and unpairings in equal parts.
  const std::size_t pairings = isChanged ? (arePaired ? edits : 0) : edits / 2;
  const std::size_t unpairings = isChanged ? (areUnpaired ? edits : 0) : edits - pairings;
  post(names::kDeviceDidPair, pairings);
  post(names::kDeviceDidUnpair, unpairings);
  return true;
}

void LocalChanges::post(const char* notification, std::size_t times) {
  for (; times > 0; --times) notifications_.post(notification);
}

}  // namespace kvr
