#pragma once

#include <string>

namespace kvr {

/// The texts that resource bundles hold in the user's language. Any thread.
class StringTables {
 public:
  virtual ~StringTables() = default;
  /// The text under `key` in a bundle's table: in the user's locale, else its language, else English;
  /// `defaultValue` when none of them has it.
  virtual std::string localizedString(const std::string& bundle, const std::string& table,
                                      const std::string& key, const std::string& defaultValue) const = 0;
};

}  // namespace kvr
