// The agent's own property lists below the home directory: the input replaces each in turn.
#include "Fuzz.h"
#include "core/warranty/KVRWarranty.h"
#include "simulated/SimulatedPlatform.h"

#include <algorithm>

namespace kvr::fuzz {
namespace {

constexpr const char* kClient = "com.tarsil.Kavrel";
constexpr const char* kMine = "one of ours";

struct Store {
  SimulatedPlatform& simulated;
  const std::string& bytes;
  const std::string path;

  /// Whether the file is either accepted or set aside as a whole, with one line about it.
  void requireTakenOrSetAside(bool isTaken) const {
    const auto errors = simulated.log.texts(LogLevel::Error);
    require(errors.size() == (isTaken ? 0U : 1U), "one error line if damaged, else none", path);
    if (isTaken) return;
    const auto slash = path.rfind('/');
    const auto all = simulated.files.list(path.substr(0, slash));
    require(std::ranges::count_if(all,
                                  [&](const std::string& name) {
                                    return name.starts_with(path + ".damaged-") &&
                                           simulated.files.get(name) == bytes;
                                  }) == 1,
            "what is damaged is set aside as it was", path);
  }
};

Store storeAt(SimulatedPlatform& simulated, const std::string& bytes, std::string_view name) {
  simulated.log.clear();
  Store store{simulated, bytes, simulated.files.homeDirectory() + "/Library/" + std::string(name)};
  simulated.files.put(store.path, bytes);
  return store;
}

void runPreferences(SimulatedPlatform& simulated, const std::string& bytes, const Value& sound) {
  const auto store = storeAt(simulated, bytes, "Preferences/com.tarsil.kvragent.plist");
  auto& preferences = simulated.preferences;
  static_cast<void>(preferences.allKeys());
  if (sound.isDictionary()) {
    for (const auto& [key, value] : sound.dictionary()) {
      require(preferences.objectForKey(key) == value, "a preference is what is stored", key);
    }
  }
  preferences.setObject(kMine, kMine);
  auto expected = sound.isDictionary() ? sound.dictionary() : Value::Dictionary();
  expected.insert_or_assign(kMine, kMine);
  require(simulated.files.getPropertyList(store.path) == Value(expected), "a change changes nothing else");
  preferences.removeObject(kMine);
  expected.erase(kMine);
  require(simulated.files.getPropertyList(store.path) == Value(expected), "a change can be undone");
  store.requireTakenOrSetAside(sound.isDictionary());
}

void runCache(SimulatedPlatform& simulated, const std::string& bytes, const Value& sound) {
  const auto store = storeAt(simulated, bytes, "Application Support/com.tarsil.Kavrel/Warranty.plist");
  const auto warranty = KVRWarranty::cachedWarrantyForSerialNumber(simulated.platform, std::nullopt);
  require((warranty != nullptr) == sound.isDictionary(), "a sound cache file is a record");
  require(!warranty || warranty->dictionaryRepresentation() == sound, "a record holds what is cached");
  store.requireTakenOrSetAside(sound.isDictionary());
}

void runFollowUps(SimulatedPlatform& simulated, const std::string& bytes) {
  const auto store = storeAt(simulated, bytes, "FollowUps/com.tarsil.Kavrel.plist");
  const auto client = simulated.followUps.newClient(kClient);
  const auto pending = [&client] {
    const auto items = client->pendingItems();
    require(bool(items), "pending items can be read");
    std::vector<FollowUpItem> others = *items;
    std::erase_if(others, [](const FollowUpItem& item) { return item.uniqueIdentifier == kMine; });
    return others;
  };
  const auto before = pending();
  const bool isTaken = simulated.log.texts(LogLevel::Error).empty();
  FollowUpItem mine;
  mine.uniqueIdentifier = kMine;
  require(!client->postItem(mine), "an item can be posted");
  require(pending() == before && client->pendingItems()->size() > before.size(), "an item is added");
  require(!client->clearPendingItems({kMine}), "an item can be cleared");
  require(pending() == before && client->pendingItems()->size() == before.size(), "an item is cleared");
  store.requireTakenOrSetAside(isTaken);
}

void runActivities(SimulatedPlatform& simulated, const std::string& bytes) {
  const auto store = storeAt(simulated, bytes, "Activities/com.tarsil.kvragent.plist");
  const auto schedule = [](SimulatedPlatform& on, const char* identifier, bool isNew) {
    const auto activity = on.activities.newActivity(identifier);
    const auto finish = [](const ActivityHandler& handler) { handler(ActivityResult::Finished); };
    if (isNew) {
      activity->registerAnew({.criteria = {.delay = 3600, .gracePeriod = 60}}, finish);
    } else {
      activity->checkIn({}, finish);
    }
  };
  for (const auto* known : {"com.tarsil.kvragent.outreach", "com.tarsil.kvragent.followuprefresh"}) {
    schedule(simulated, known, false);
  }
  const bool isTaken = simulated.log.texts(LogLevel::Error).empty();
  schedule(simulated, kMine, true);
  simulated.queues.run();
  store.requireTakenOrSetAside(isTaken);
  require(simulated.faults().empty(), "every run comes to its end");

  SimulatedPlatform next;
  next.files.takeOver(simulated.files);
  schedule(next, kMine, false);
  const auto before = next.files.get(store.path);
  next.queues.advance(7200);
  require(next.files.get(store.path) != before, "what was registered runs after a restart");
  require(next.log.texts(LogLevel::Error).empty(), "what was written is sound");
}

}  // namespace

void run(std::string_view input) {
  const std::string bytes(input);
  const auto tree = readPropertyList(bytes);
  const Value sound = tree && tree->isDictionary() ? *tree : Value();
  SimulatedPlatform simulated;
  runPreferences(simulated, bytes, sound);
  runCache(simulated, bytes, sound);
  runFollowUps(simulated, bytes);
  runActivities(simulated, bytes);
}

}  // namespace kvr::fuzz
