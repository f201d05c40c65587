#pragma once

#include "platform/codec/PropertyList.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace kvr {

/// Builds a tree from the events of a reader, without recursion.
///
/// A container is opened, filled with `add` or further containers, and closed; in a dictionary each value
/// follows its key, and the last of equal keys wins. Every operation returns whether it succeeded. After a
/// failure, `problem()` has the reason, and the reader should give up.
class TreeBuilder {
 public:
  /// The tree may hold at most `maximumValues` values, containers included.
  explicit TreeBuilder(std::size_t maximumValues) : maximumValues_(maximumValues) { open_.reserve(8); }
  /// Keeps the top level only: the entries of a dictionary under these keys, with containers as empty ones;
  /// of an array, nothing. The skipped parts may have any size and depth.
  explicit TreeBuilder(EntryKeys only) : only_(only) {}

  bool openArray() { return open(false); }
  bool openDictionary() { return open(true); }
  bool setKey(std::string key);
  bool add(Value&& value);
  bool close();

  /// How many containers are open.
  std::size_t depth() const { return open_.size() + passedOver_.size(); }
  /// Whether the innermost open container is a dictionary.
  bool isInDictionary() const {
    if (!passedOver_.empty()) return passedOver_.back().isDictionary;
    return !open_.empty() && open_.back().isDictionary;
  }
  /// Whether the one value at the top level is there, with nothing left open.
  bool isComplete() const { return complete_; }
  /// The complete tree.
  Value take() { return std::move(tree_); }
  /// Why the last operation failed.
  const char* problem() const { return problem_; }

 private:
  struct Container {
    bool isDictionary;
    Value::Array array;
    Value::Dictionary dictionary;
    std::optional<std::string> key;
  };
  /// An open container that is skipped.
  struct PassedOver {
    bool isDictionary;
    bool hasKey;
  };

  bool hasKey() const {
    return passedOver_.empty() ? open_.back().key.has_value() : passedOver_.back().hasKey;
  }
  bool open(bool isDictionary);
  bool mayTakeValue();
  void place(Value&& value);
  bool refuse(const char* problem);

  const std::size_t maximumValues_ = 0;
  const std::optional<EntryKeys> only_;
  std::size_t values_ = 0;
  std::vector<Container> open_;
  std::vector<PassedOver> passedOver_;  ///< the open containers inside `open_`
  Value tree_;
  bool complete_ = false;
  const char* problem_ = "";
};

}  // namespace kvr
