#pragma once

#include "platform/services/Preferences.h"
#include "platform/stores/PropertyListFiles.h"

namespace kvr {

/// Keeps preferences in one property list per domain, below "Library/Preferences" of the home directory.
///
/// A file that cannot be read is not overwritten: its keys then have their registered values, and changes are
/// refused. Changes are made under the directory's lock, on the file's current content, so concurrent threads
/// and processes do not lose each other's keys.
class FilePreferences : public Preferences {
 public:
  FilePreferences(PropertyListFiles& lists, Log& log, const std::string& standardDomain);

  void registerDefaults(const Value::Dictionary& defaults) override;
  Value objectForKey(std::string_view key) const override;
  Value objectForKey(std::string_view key, std::string_view domain) const override;
  void setObject(const Value& value, std::string_view key) override;
  void setObjects(const Value::Dictionary& values) override;
  void removeObject(std::string_view key) override;
  std::vector<std::string> allKeys() const override;
  void update(std::string_view key, const std::function<Value(const Value&)>& change) override;

 private:
  std::string pathOf(std::string_view domain) const;
  void reportUnchanged(std::string_view key, const Error& error);
  void reportUnstored(std::string_view key, const Error& error);

  PropertyListFiles& lists_;
  Log& log_;
  const std::string directory_;
  const std::string standardPath_;
  mutable std::mutex defaultsMutex_;
  Value::Dictionary defaults_;
};

}  // namespace kvr
