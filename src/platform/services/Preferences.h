#pragma once

#include "platform/value/Value.h"

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kvr {

/// The agent's own preference domain (the standard domain); other applications' domains can be read.
///
/// Reads see changes made by other processes. A change is on disk when the operation returns. A change to an
/// equal value writes nothing; one that cannot be stored is logged as an error and has no effect. Any thread.
/// A key can hold any `Value` but null.
class Preferences {
 public:
  virtual ~Preferences() = default;

  /// Fallbacks for keys that have no stored value. Added to those registered before; never stored.
  virtual void registerDefaults(const Value::Dictionary& defaults) = 0;
  /// The stored value, else the registered one, else null.
  virtual Value objectForKey(std::string_view key) const = 0;
  /// A value stored in another application's domain; null when there is none.
  virtual Value objectForKey(std::string_view key, std::string_view domain) const = 0;
  /// Stores a value; null removes.
  virtual void setObject(const Value& value, std::string_view key) = 0;
  /// Stores several values, none of them null, in one durable change: all of them or none.
  virtual void setObjects(const Value::Dictionary& values) = 0;
  virtual void removeObject(std::string_view key) = 0;
  /// Every key that has a stored or a registered value, in ascending order.
  virtual std::vector<std::string> allKeys() const = 0;
  /// An atomic read-modify-write: passes the stored value (null for none) to `change` and stores what it
  /// returns (null removes the key), with no change by another thread or process in between. `change` must
  /// not call the preferences.
  virtual void update(std::string_view key, const std::function<Value(const Value&)>& change) = 0;

  // Typed reads. A value that is not a string or date counts as absent; the others convert as
  // `Value::asBool`, `asDouble` and `asInteger` do.
  std::optional<std::string> stringForKey(std::string_view key) const {
    return objectForKey(key).stringIfAny();
  }
  std::optional<Date> dateForKey(std::string_view key) const { return objectForKey(key).dateIfAny(); }
  bool boolForKey(std::string_view key) const { return objectForKey(key).asBool(); }
  double doubleForKey(std::string_view key) const { return objectForKey(key).asDouble(); }
  std::int64_t integerForKey(std::string_view key) const { return objectForKey(key).asInteger(); }
};

}  // namespace kvr
