#pragma once

#include "platform/value/Value.h"

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kvr {

/// The agent's own preference domain, the standard domain, and reading of other applications' domains.
///
/// Reads see changes made from outside. A change is on disk when the operation returns; one that changes
/// nothing writes nothing; one that cannot be stored is an error line and leaves everything as it was.
/// Any thread. A key holds any `Value` but null.
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
  /// Reads what is stored (null for nothing), hands it to `change` and stores what that returns (null
  /// removes), with no other change of the domain in between, by whomever. `change` must not call back.
  virtual void update(std::string_view key, const std::function<Value(const Value&)>& change) = 0;

  // Typed readings; a value of another kind counts as absent, or reads as a stored setting does.
  std::optional<std::string> stringForKey(std::string_view key) const {
    return objectForKey(key).stringIfAny();
  }
  std::optional<Date> dateForKey(std::string_view key) const { return objectForKey(key).dateIfAny(); }
  bool boolForKey(std::string_view key) const { return objectForKey(key).asBool(); }
  double doubleForKey(std::string_view key) const { return objectForKey(key).asDouble(); }
  std::int64_t integerForKey(std::string_view key) const { return objectForKey(key).asInteger(); }
};

}  // namespace kvr
