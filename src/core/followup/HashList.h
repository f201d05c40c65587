#pragma once

#include "platform/services/Preferences.h"

#include <string>
#include <string_view>

namespace kvr {

/// One of the lists of serial hashes in the preferences. Every change is one atomic read-modify-write, so
/// concurrent changes are not lost. A stored value that is not a list counts as empty. Any thread.
class HashList {
 public:
  HashList(Preferences& preferences, std::string_view key) : preferences_(preferences), key_(key) {}

  bool contains(const std::string& hash) const;
  /// Adds the hash, whether it is in the list or not.
  void append(const std::string& hash);
  /// Adds the hash if it is not in the list.
  void insert(const std::string& hash);
  /// Removes every occurrence.
  void remove(const std::string& hash);

 private:
  Preferences& preferences_;
  const std::string key_;
};

}  // namespace kvr
