#include "conformance/FileWorld.h"
#include "platform/stores/FilePreferences.h"

#include <thread>

namespace kvr {
namespace {

const std::string kDomain = "com.tarsil.kvragent";

/// The preferences of one process.
struct Process {
  Process(Files& files, FileWorld& world)
      : lists(files, world.clock, world.log), preferences(lists, world.log, kDomain) {}

  PropertyListFiles lists;
  FilePreferences preferences;
};

struct APreference : InBothWorlds {
  std::string pathOf(const std::string& domain) { return folder + "/" + domain + ".plist"; }
  Value stored() { return world.tree(pathOf(kDomain)); }
  /// The inode changes with every write.
  std::uint64_t inodeOfDomain() {
    return (*world.files().stamp(pathOf(kDomain))).value_or(FileStamp{}).inode;
  }

  const std::string folder = world.path("Library/Preferences");
  Process process{world.files(), world};
  FilePreferences& preferences = process.preferences;
};
INSTANTIATE_TEST_SUITE_P(, APreference, ::testing::Bool(), APreference::nameOf);

TEST_P(APreference, IsTheStoredValueElseTheRegisteredOne) {
  preferences.registerDefaults({{"a", 1}, {"b", 2}});
  preferences.registerDefaults({{"b", 3}, {"none", Value()}});
  EXPECT_EQ(preferences.integerForKey("a"), 1);
  EXPECT_EQ(preferences.integerForKey("b"), 3);
  EXPECT_FALSE(world.get(pathOf(kDomain)));
  preferences.setObject("text", "a");
  preferences.setObject(false, "c");
  EXPECT_EQ(preferences.objectForKey("a"), Value("text"));
  EXPECT_THAT(preferences.allKeys(), ElementsAre("a", "b", "c"));
  EXPECT_EQ(stored(), Value(Dictionary{{"a", "text"}, {"c", false}}));
  preferences.removeObject("a");
  EXPECT_EQ(preferences.integerForKey("a"), 1);
  preferences.setObject({}, "c");
  EXPECT_TRUE(preferences.objectForKey("c").isNull());
  EXPECT_THAT(preferences.allKeys(), ElementsAre("a", "b"));
}

TEST_P(APreference, KeepsEveryKindOfValueAndSeesChangesFromOutside) {
  const Value value = Array{Array{true, -1, ~std::uint64_t{0}, 0.5, "t\u00e9xt", Date{1795536283.25}},
                            Value::Bytes{0, 255}, Dictionary{{"k", "v"}}};
  preferences.setObject(value, "key");
  EXPECT_EQ(preferences.objectForKey("key"), value);
  world.putTree(pathOf(kDomain), Dictionary{{"key", "from outside"}, {"other", 1}});
  EXPECT_EQ(preferences.objectForKey("key"), Value("from outside"));
  preferences.setObject(2, "key");
  EXPECT_EQ(stored(), Value(Dictionary{{"key", 2}, {"other", 1}}));
  preferences.setObjects({{"key", 3}, {"more", 4}});
  EXPECT_EQ(stored(), Value(Dictionary{{"key", 3}, {"more", 4}, {"other", 1}}));
}

TEST_P(APreference, IsReadOnceAtOneLookWhichAChangeEnds) {
  world.putTree(pathOf(kDomain), Dictionary{{"a", 1}});
  const PropertyListFiles::Look look(process.lists);
  const auto both = [this] {
    const PropertyListFiles::Look inner(process.lists);
    return std::pair(preferences.integerForKey("a"), preferences.objectForKey("b", "com.tarsil.Widgetry"));
  };
  EXPECT_EQ(both(), std::pair(std::int64_t{1}, Value()));
  world.putTree(pathOf(kDomain), Dictionary{{"a", 2}, {"c", 3}});
  world.putTree(pathOf("com.tarsil.Widgetry"), Dictionary{{"b", 4}});
  EXPECT_EQ(both(), std::pair(std::int64_t{1}, Value()));
  std::thread([&] { EXPECT_EQ(both(), std::pair(std::int64_t{2}, Value(4))); }).join();
  preferences.update("a", [](const Value& a) { return Value(a.asInteger() + 10); });
  EXPECT_EQ(stored(), Value(Dictionary{{"a", 12}, {"c", 3}}));
  EXPECT_EQ(both(), std::pair(std::int64_t{12}, Value(4)));
  const PropertyListFiles::Look another(process.lists);
  EXPECT_EQ(both(), std::pair(std::int64_t{12}, Value(4)));
  const auto encoding = PropertyListEncoding::Binary;
  EXPECT_FALSE(process.lists.write(pathOf("com.tarsil.Widgetry"), Dictionary{{"b", 5}}, encoding));
  EXPECT_EQ(both(), std::pair(std::int64_t{12}, Value(5)));
}

TEST_P(APreference, IsWrittenOnlyWhenItChanges) {
  const Value equals[][2] = {{1, 1}, {1.0, 1}, {{}, {}}, {Array{1}, Array{1}}, {std::nan(""), std::nan("")}};
  const Value changes[][2] = {{1, true}, {1, {}}, {"1", 1}, {{}, 1}};
  const auto writes = [&](const Value(&values)[2]) {
    preferences.setObject(values[0], "key");
    const auto inode = inodeOfDomain();
    preferences.setObject(values[1], "key");
    EXPECT_EQ(preferences.objectForKey("key"), values[1]);
    return inodeOfDomain() != inode;
  };
  for (const auto& values : equals) EXPECT_FALSE(writes(values)) << describe(values[0]);
  for (const auto& values : changes) EXPECT_TRUE(writes(values)) << describe(values[0]);
  const auto inode = inodeOfDomain();
  preferences.setObjects({{"key", 1}});
  EXPECT_EQ(inodeOfDomain(), inode);
}

TEST_P(APreference, OfAnotherDomainIsReadWhereTheNameLeadsNowhereElse) {
  world.putTree(pathOf("com.tarsil.Widgetry"), Dictionary{{"size", "L"}});
  world.putTree(world.path("Library/outside.plist"), Dictionary{{"size", "X"}});
  EXPECT_EQ(preferences.objectForKey("size", "com.tarsil.Widgetry"), Value("L"));
  preferences.registerDefaults({{"size", "default"}});
  const std::string domains[] = {
      "", "..", "../outside", "com.tarsil.Widgetry/", "missing", std::string("com.tarsil.Widgetry\0", 20)};
  for (const auto& domain : domains) EXPECT_TRUE(preferences.objectForKey("size", domain).isNull()) << domain;
  EXPECT_THAT(world.log.lines(), IsEmpty());
}

TEST_P(APreference, OfADomainThatCannotBeReadIsNeverOverwritten) {
  preferences.registerDefaults({{"a", 1}});
  const std::string large(PropertyListFiles::kLimit + 1, ' ');
  world.put(pathOf(kDomain), large);
  EXPECT_EQ(preferences.integerForKey("a"), 1);
  EXPECT_THAT(preferences.allKeys(), ElementsAre("a"));
  preferences.setObject(2, "a");
  preferences.update("a", [](const Value&) -> Value { return ADD_FAILURE(), 3; });
  preferences.setObjects({{"b", 2}, {"c", 3}});
  EXPECT_EQ(world.get(pathOf(kDomain)), large);
  EXPECT_THAT(
      world.errors(),
      ElementsAre(HasSubstr("cannot be read"), HasSubstr("preference a is not changed"),
                  HasSubstr("preference a is not changed"), HasSubstr("preference b, c is not changed")));
}

TEST_P(APreference, LosesNoEntryHoweverManyThreadsAndProcessesAddThem) {
  constexpr int kThreads = 4;
  constexpr int kEach = 25;
  const auto otherFiles = world.filesOfAnotherProcess();
  Process other(otherFiles ? *otherFiles : world.files(), world);
  std::vector<std::thread> threads;
  for (int number = 0; number < kThreads; ++number) {
    threads.emplace_back([&, number] {
      auto& mine = number % 2 == 0 ? preferences : other.preferences;
      for (int i = 0; i < kEach; ++i) {
        mine.update("list", [&](const Value& list) {
          auto entries = list.isArray() ? list.array() : Array();
          entries.emplace_back(number * kEach + i);
          return Value(std::move(entries));
        });
        mine.setObject(i, "thread " + std::to_string(number));
      }
    });
  }
  for (auto& thread : threads) thread.join();
  const auto list = preferences.objectForKey("list");
  std::set<std::int64_t> entries;
  for (const auto& entry : list.array()) entries.insert(entry.asInteger());
  EXPECT_THAT(entries, SizeIs(kThreads * kEach));
  EXPECT_THAT(world.log.lines(), IsEmpty());
  EXPECT_THAT(world.names(folder), ElementsAre(kDomain + ".plist"));
}

}  // namespace
}  // namespace kvr
