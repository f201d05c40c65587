#include "core/followup/HashList.h"

#include <algorithm>

namespace kvr {
namespace {

Value::Array listFrom(const Value& stored) { return stored.isArray() ? stored.array() : Value::Array(); }

bool holds(const Value& stored, const std::string& hash) {
  const auto list = listFrom(stored);
  return std::find(list.begin(), list.end(), Value(hash)) != list.end();
}

Value withAppended(const Value& stored, const std::string& hash) {
  auto list = listFrom(stored);
  list.emplace_back(hash);
  return list;
}

}  // namespace

bool HashList::contains(const std::string& hash) const {
  return holds(preferences_.objectForKey(key_), hash);
}

void HashList::append(const std::string& hash) {
  preferences_.update(key_, [&](const Value& stored) { return withAppended(stored, hash); });
}

void HashList::insert(const std::string& hash) {
  preferences_.update(
      key_, [&](const Value& stored) { return holds(stored, hash) ? stored : withAppended(stored, hash); });
}

void HashList::remove(const std::string& hash) {
  preferences_.update(key_, [&](const Value& stored) -> Value {
    if (!holds(stored, hash)) return stored;
    auto list = listFrom(stored);
    std::erase(list, Value(hash));
    return list;
  });
}

}  // namespace kvr
