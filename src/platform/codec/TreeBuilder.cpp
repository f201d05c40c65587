#include "platform/codec/TreeBuilder.h"

#include "platform/codec/PropertyList.h"

#include <algorithm>

namespace kvr {

bool TreeBuilder::refuse(const char* problem) {
  problem_ = problem;
  return false;
}

bool TreeBuilder::mayTakeValue() {
  if (complete_) return refuse("a second value at the top level");
  if (isInDictionary() && !hasKey()) return refuse("a dictionary value without a key");
  if (!passedOver_.empty()) passedOver_.back().hasKey = false;
  if (!only_ && ++values_ > maximumValues_) return refuse("too many values");
  return true;
}

bool TreeBuilder::open(bool isDictionary) {
  if (!mayTakeValue()) return false;
  if (only_ && !open_.empty()) {
    if (passedOver_.empty()) place(isDictionary ? Value(Value::Dictionary()) : Value(Value::Array()));
    passedOver_.push_back({isDictionary, false});
    return true;
  }
  if (open_.size() == kMaximumDepth) return refuse("nested too deep");
  open_.push_back({isDictionary, {}, {}, std::nullopt});
  return true;
}

bool TreeBuilder::setKey(std::string key) {
  if (!isInDictionary()) return refuse("a key outside a dictionary");
  if (hasKey()) return refuse("a dictionary key without a value");
  if (passedOver_.empty()) {
    open_.back().key = std::move(key);
  } else {
    passedOver_.back().hasKey = true;
  }
  return true;
}

bool TreeBuilder::add(Value&& value) {
  if (!mayTakeValue()) return false;
  if (passedOver_.empty()) place(std::move(value));
  return true;
}

bool TreeBuilder::close() {
  if (open_.empty()) return refuse("the end of a container that is not open");
  if (isInDictionary() && hasKey()) return refuse("a dictionary key without a value");
  if (!passedOver_.empty()) {
    passedOver_.pop_back();
    return true;
  }
  auto& container = open_.back();
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
  if (only_ && (!container.isDictionary || std::ranges::find(*only_, *container.key) == only_->end())) {
    container.key.reset();
    return;
  }
  if (!container.isDictionary) {
    container.array.push_back(std::move(value));
    return;
  }
  // Keys mostly come sorted, as all our writers sort them, so the hint fits. The last of equal keys wins.
  auto& dictionary = container.dictionary;
  dictionary.emplace_hint(dictionary.end(), *std::move(container.key), Value())->second = std::move(value);
  container.key.reset();
}

}  // namespace kvr
