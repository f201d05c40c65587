#include "platform/stores/FileFollowUpCenter.h"

#include "platform/names/Names.h"
#include "platform/text/FileName.h"

#include <algorithm>
#include <cerrno>
#include <functional>
#include <set>
#include <utility>

namespace kvr {
namespace {

constexpr const char* kItems = "items";
constexpr const char* kUniqueIdentifier = "uniqueIdentifier";
constexpr const char* kGroupIdentifier = "groupIdentifier";
constexpr const char* kTargetBundleIdentifier = "targetBundleIdentifier";
constexpr const char* kExtensionIdentifier = "extensionIdentifier";
constexpr const char* kDisplayStyle = "displayStyle";
constexpr const char* kTitle = "title";
constexpr const char* kInformativeFooterText = "informativeFooterText";
constexpr const char* kExpirationDate = "expirationDate";
constexpr const char* kUserInfo = "userInfo";
constexpr const char* kActions = "actions";
constexpr const char* kLabel = "label";
constexpr const char* kURL = "url";

void put(Value::Dictionary& entry, const char* key, const Value& value) {
  if (!value.isNull()) entry.emplace(key, value);
}

Value entryOf(const FollowUpItem& item) {
  Value::Array actions;
  for (const auto& action : item.actions) {
    Value::Dictionary entry;
    put(entry, kLabel, action.label);
    put(entry, kURL, action.url);
    actions.emplace_back(std::move(entry));
  }
  Value::Dictionary entry{
      {kDisplayStyle, item.displayStyle}, {kUserInfo, item.userInfo}, {kActions, std::move(actions)}};
  put(entry, kUniqueIdentifier, item.uniqueIdentifier);
  put(entry, kGroupIdentifier, item.groupIdentifier);
  put(entry, kTargetBundleIdentifier, item.targetBundleIdentifier);
  put(entry, kExtensionIdentifier, item.extensionIdentifier);
  put(entry, kTitle, item.title);
  put(entry, kInformativeFooterText, item.informativeFooterText);
  put(entry, kExpirationDate, item.expirationDate);
  return entry;
}

std::uint64_t bitsIn(const Value& value) {
  if (value.kind() == Value::Kind::UInt) return value.unsignedInteger();
  return static_cast<std::uint64_t>(std::max<std::int64_t>(value.asInteger(), 0));
}

FollowUpItem itemOf(const Value& entry) {
  FollowUpItem item;
  item.uniqueIdentifier = entry[kUniqueIdentifier].stringIfAny();
  item.groupIdentifier = entry[kGroupIdentifier].stringIfAny();
  item.targetBundleIdentifier = entry[kTargetBundleIdentifier].stringIfAny();
  item.extensionIdentifier = entry[kExtensionIdentifier].stringIfAny();
  item.displayStyle = bitsIn(entry[kDisplayStyle]);
  item.title = entry[kTitle];
  item.informativeFooterText = entry[kInformativeFooterText];
  item.expirationDate = entry[kExpirationDate].dateIfAny();
  if (entry[kUserInfo].isDictionary()) item.userInfo = entry[kUserInfo].dictionary();
  if (entry[kActions].isArray()) {
    for (const auto& action : entry[kActions].array()) {
      item.actions.push_back({action[kLabel], action[kURL].stringIfAny()});
    }
  }
  return item;
}

std::optional<Error> complaintAbout(const Value& tree) {
  const Value& items = tree[kItems];
  if (items.isNull()) return std::nullopt;
  if (!items.isArray()) return Error{"followups", 0, "the items are not an array"};
  for (const auto& entry : items.array()) {
    if (!entry[kUniqueIdentifier].isString()) {
      return Error{"followups", 0, "an item has no unique identifier"};
    }
  }
  return std::nullopt;
}

/// The serial numbers of the devices that have an item in only one of the two lists.
std::set<std::string> differences(const Value& before, const Value& after) {
  const auto only = [](const Value& here, const Value& there, std::set<std::string>& found) {
    if (!here.isArray()) return;
    const Value::Array others = there.isArray() ? there.array() : Value::Array();
    for (const Value& entry : here.array()) {
      if (std::ranges::find(others, entry) != others.end()) continue;
      if (const auto serialNumber = entry[kUserInfo][names::kFollowUpSerialNumber].stringIfAny()) {
        found.insert(*serialNumber);
      }
    }
  };
  std::set<std::string> found;
  only(before, after, found);
  only(after, before, found);
  return found;
}

}  // namespace

class FileFollowUpCenter::Client : public FollowUpCenterClient {
 public:
  Client(PropertyListFiles& lists, const Clock& clock, Observers& observers, const std::string& identifier)
      : lists_(lists),
        clock_(clock),
        observers_(observers),
        isUsable_(canNameFile(identifier)),
        directory_(lists.files().homeDirectory() + "/" + std::string(names::kFollowUpsFolder)),
        path_(directory_ + "/" + identifier + ".plist") {}

  std::optional<Error> postItem(const FollowUpItem& item) override {
    if (!item.uniqueIdentifier) {
      return Error{"followups", EINVAL, "an item without unique identifier cannot be posted"};
    }
    return change([&item](Value::Array& entries) {
      const auto pending = std::ranges::find_if(entries, [&item](const Value& entry) {
        return entry[kUniqueIdentifier].string() == *item.uniqueIdentifier;
      });
      if (pending == entries.end()) {
        entries.push_back(entryOf(item));
      } else {
        *pending = entryOf(item);
      }
    });
  }

  std::optional<Error> clearPendingItems(const std::vector<std::string>& uniqueIdentifiers) override {
    return change([&uniqueIdentifiers](Value::Array& entries) {
      std::erase_if(entries, [&uniqueIdentifiers](const Value& entry) {
        return std::ranges::find(uniqueIdentifiers, entry[kUniqueIdentifier].string()) !=
               uniqueIdentifiers.end();
      });
    });
  }

  Result<std::vector<FollowUpItem>> pendingItems() override {
    const auto tree = read();
    if (!tree) return tree.error();
    std::vector<FollowUpItem> items;
    for (const auto& entry : pendingEntries(*tree)) items.push_back(itemOf(entry));
    return items;
  }

 private:
  Result<Value> read() const {
    if (!isUsable_) return Error{"followups", EINVAL, "the client's identifier names no file"};
    return lists_.read(path_, PropertyListFiles::Expected::Dictionary,
                       PropertyListFiles::WhenDamaged::SetAside, complaintAbout);
  }

  Value::Array pendingEntries(const Value& tree) const {
    if (!tree[kItems].isArray()) return {};
    Value::Array entries = tree[kItems].array();
    std::erase_if(entries, [now = clock_.now()](const Value& entry) {
      const auto expires = entry[kExpirationDate].dateIfAny();
      return expires && !(*expires > now);
    });
    return entries;
  }

  using Modify = std::function<void(Value::Array&)>;

  /// The tree after the change; null if nothing changes. `before` becomes the items that it replaces.
  Result<Value> changedBy(const Modify& apply, Value& before) const {
    const auto stored = read();
    if (!stored) return stored.error();
    Value::Array entries = pendingEntries(*stored);
    apply(entries);
    Value::Dictionary tree = stored->isDictionary() ? stored->dictionary() : Value::Dictionary();
    before = tree[kItems];
    if (before == Value(entries) || (before.isNull() && entries.empty())) return Value();
    tree.insert_or_assign(kItems, std::move(entries));
    return Value(std::move(tree));
  }

  std::optional<Error> change(const Modify& apply) {
    Value before;
    // A change without effect, such as clearing an item that is not pending, needs no lock.
    auto changed = changedBy(apply, before);
    if (changed && changed->isNull()) return std::nullopt;
    const auto lock = lists_.lock(directory_);
    changed = changedBy(apply, before);
    if (!changed) return changed.error();
    if (changed->isNull()) return std::nullopt;
    auto error = lists_.write(path_, *changed, PropertyListEncoding::Binary);
    if (!error && observers_.areThere())
      observers_.tell({{}, differences(before, (*changed)[kItems]), false});
    return error;
  }

  PropertyListFiles& lists_;
  const Clock& clock_;
  Observers& observers_;
  const bool isUsable_;
  const std::string directory_;
  const std::string path_;
};

std::unique_ptr<FollowUpCenterClient> FileFollowUpCenter::newClient(std::string clientIdentifier) {
  return std::make_unique<Client>(lists_, clock_, observers_, clientIdentifier);
}

}  // namespace kvr
