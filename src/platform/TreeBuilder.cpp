#include "platform/TreeBuilder.h"

#include "platform/PropertyList.h"

namespace kvr {

bool TreeBuilder::refuse(const char* problem) {
  problem_ = problem;
  return false;
}

bool TreeBuilder::mayTakeValue() {
  if (complete_) return refuse("a second value at the top level");
  if (isInDictionary() && !open_.back().key) return refuse("a dictionary value without a key");
  if (++values_ > maximumValues_) return refuse("too many values");
  return true;
}

bool TreeBuilder::open(bool isDictionary) {
  if (!mayTakeValue()) return false;
  if (open_.size() == kMaximumDepth) return refuse("nested too deep");
  open_.push_back({isDictionary, {}, {}, std::nullopt});
  return true;
}

bool TreeBuilder::setKey(std::string key) {
  if (!isInDictionary()) return refuse("a key outside a dictionary");
  if (open_.back().key) return refuse("a dictionary key without a value");
  open_.back().key = std::move(key);
  return true;
}

bool TreeBuilder::add(Value&& value) {
  if (!mayTakeValue()) return false;
  place(std::move(value));
  return true;
}

bool TreeBuilder::close() {
  if (open_.empty()) return refuse("the end of a container that is not open");
  auto& container = open_.back();
  if (container.key) return refuse("a dictionary key without a value");
  auto value =
      container.isDictionary ? Value(std::move(container.dictionary)) : Value(std::move(container.array));
  open_.pop_back();
  place(std::move(value));
  return true;
}

void TreeBuilder::place(Value&& value) {
  if (open_.empty()) {
    tree_ = std::move(value);
    complete_ = true;
    return;
  }
  auto& container = open_.back();
  if (!container.isDictionary) {
    container.array.push_back(std::move(value));
    return;
  }
  // Keys mostly come sorted, as every writer here leaves them; of equal ones the last counts.
  auto& dictionary = container.dictionary;
  dictionary.emplace_hint(dictionary.end(), *std::move(container.key), Value())->second = std::move(value);
  container.key.reset();
}

}  // namespace kvr
