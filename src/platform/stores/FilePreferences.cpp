#include "platform/stores/FilePreferences.h"

#include "platform/names/Names.h"
#include "platform/text/FileName.h"

#include <set>
#include <utility>

namespace kvr {
namespace {

constexpr auto kDictionary = PropertyListFiles::Expected::Dictionary;
constexpr auto kSetAside = PropertyListFiles::WhenDamaged::SetAside;

/// "one, another"
std::string keysOf(const Value::Dictionary& values) {
  std::string keys;
  for (const auto& [key, value] : values) keys.append(keys.empty() ? "" : ", ").append(key);
  return keys;
}

}  // namespace

FilePreferences::FilePreferences(PropertyListFiles& lists, Log& log, const std::string& standardDomain)
    : lists_(lists),
      log_(log),
      directory_(lists.files().homeDirectory() + "/" + std::string(names::kPreferencesFolder)),
      standardPath_(pathOf(standardDomain)) {}

std::string FilePreferences::pathOf(std::string_view domain) const {
  return directory_ + "/" + std::string(domain) + ".plist";
}

void FilePreferences::registerDefaults(const Value::Dictionary& defaults) {
  const std::lock_guard lock(defaultsMutex_);
  for (const auto& [key, value] : defaults) defaults_.insert_or_assign(key, value);
}

Value FilePreferences::objectForKey(std::string_view key) const {
  const auto stored = lists_.read(standardPath_, kDictionary, kSetAside);
  if (stored && !(*stored)[key].isNull()) return (*stored)[key];
  const std::lock_guard lock(defaultsMutex_);
  const auto found = defaults_.find(key);
  return found == defaults_.end() ? Value() : found->second;
}

Value FilePreferences::objectForKey(std::string_view key, std::string_view domain) const {
  if (!canNameFile(domain)) return {};
  const auto stored = lists_.read(pathOf(domain), kDictionary, kSetAside);
  return stored ? (*stored)[key] : Value();
}

void FilePreferences::setObject(const Value& value, std::string_view key) {
  update(key, [&value](const Value&) { return value; });
}

void FilePreferences::setObjects(const Value::Dictionary& values) {
  const auto lock = lists_.lock(directory_);
  const auto stored = lists_.read(standardPath_, kDictionary, kSetAside);
  if (!stored) {
    reportUnchanged(keysOf(values), stored.error());
    return;
  }
  Value::Dictionary tree = stored->isDictionary() ? stored->dictionary() : Value::Dictionary();
  for (const auto& [key, value] : values) tree.insert_or_assign(key, value);
  if (Value(tree) == *stored) return;
  if (const auto error = lists_.write(standardPath_, std::move(tree), PropertyListEncoding::Binary)) {
    reportUnstored(keysOf(values), *error);
  }
}

void FilePreferences::removeObject(std::string_view key) { setObject({}, key); }

std::vector<std::string> FilePreferences::allKeys() const {
  std::set<std::string> keys;
  const auto stored = lists_.read(standardPath_, kDictionary, kSetAside);
  if (stored && stored->isDictionary()) {
    for (const auto& [key, value] : stored->dictionary()) {
      if (!value.isNull()) keys.insert(key);
    }
  }
  const std::lock_guard lock(defaultsMutex_);
  for (const auto& [key, value] : defaults_) {
    if (!value.isNull()) keys.insert(key);
  }
  return {keys.begin(), keys.end()};
}

void FilePreferences::update(std::string_view key, const std::function<Value(const Value&)>& change) {
  const auto lock = lists_.lock(directory_);
  const auto stored = lists_.read(standardPath_, kDictionary, kSetAside);
  if (!stored) {
    reportUnchanged(key, stored.error());
    return;
  }
  const Value& before = (*stored)[key];
  Value after = change(before);
  // Two nulls are equal too: nothing is stored, and nothing is to be stored.
  if (after == before) return;
  Value::Dictionary tree = stored->isDictionary() ? stored->dictionary() : Value::Dictionary();
  if (after.isNull()) {
    tree.erase(tree.find(key));
  } else {
    tree.insert_or_assign(std::string(key), std::move(after));
  }
  if (const auto error = lists_.write(standardPath_, std::move(tree), PropertyListEncoding::Binary)) {
    reportUnstored(key, *error);
  }
}

void FilePreferences::reportUnchanged(std::string_view key, const Error& error) {
  log_.error("preference %s is not changed, the others cannot be read: %@", key, error);
}

void FilePreferences::reportUnstored(std::string_view key, const Error& error) {
  log_.error("preference %s cannot be stored: %@", key, error);
}

}  // namespace kvr
