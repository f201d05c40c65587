// Runs the real agent and kills it at, or fails, each of its file system calls in turn.
#include "integration/support/AgentWorld.h"
#include "integration/support/Injection.h"
#include "platform/text/SHA256Hash.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstring>

namespace kvr::testing {
namespace {

namespace fs = std::filesystem;
/// The most error lines after one failed call: one about the call itself, and two about a download that
/// failed.
constexpr std::size_t kMostComplaints = 3;
/// The same if all later calls fail too.
constexpr std::size_t kMostComplaintsOfLasting = 4;

/// A file's contents without dates, which differ in every run.
Value steady(const Value& tree) {
  if (tree.isDate()) return Date{0};
  if (!tree.isDictionary()) return tree;
  Dictionary entries;
  for (const auto& [key, value] : tree.dictionary()) entries.emplace(key, steady(value));
  return entries;
}

Value contentOf(const fs::path& path) {
  const std::string bytes = *contentOfFile(path);
  if (path.extension() == ".plist") return steady(*readPropertyList(bytes));
  return bytes.starts_with("-----BEGIN ") && bytes.ends_with("-----\n") ? "PEM" : bytes;
}

/// A directory below "Library", and a call of a client that changes it in every round.
struct Store {
  std::string folder;
  unsigned changes;      ///< how many files change
  unsigned directories;  ///< how many directories are created in it
  std::function<void(AgentWorld&, int round)> prepare;
  std::function<void(const RawBusClient&, int round)> change;
};

std::vector<Store> allStores() {
  const auto nothing = [](AgentWorld&, int) {};
  const auto dismiss = [](const RawBusClient& client, int) {
    client.call("DismissFollowUpForSerialNumber", "s", {World::kPhone});
  };
  const auto refresh = [](const char* serialNumber) {
    return [serialNumber](const RawBusClient& client, int) {
      client.call("GetDeviceInfoForSerialNumber", "st", {serialNumber, World::Refresh});
    };
  };
  const auto setLabel = [](AgentWorld& world, int round) {
    world.setCoverage("default", R"({"coverageLocalizedLabel":"Label )" + std::to_string(round) + "\"}");
  };
  const auto schedule = [](const RawBusClient& client, int round) {
    client.call("ScheduleOutreachAfter", "d", {kDay + round});
  };
  return {{"Preferences", 1, 0, nothing, schedule},
          {"FollowUps", 1, 0, nothing, dismiss},
          {"Activities", 1, 0, nothing, schedule},
          {"Application Support", 1, 0, setLabel, refresh(World::kFirstWatch)},
          {"Keys", 4, 1, nothing, refresh(World::kPhone)}};
}

struct TheAgentsStores : ::testing::Test {
  /// The contents of a store's files, by file name.
  using State = Dictionary;
  void SetUp() override {
    if (KVR_SANITIZED) GTEST_SKIP() << "a sanitizer's runtime stands before the injector's calls";
    const auto file = world.directory.write("injection", std::string(sizeof(Injection), '\0'));
    const int descriptor = ::open(file.c_str(), O_RDWR | O_CLOEXEC);
    void* const page = ::mmap(nullptr, sizeof(Injection), PROT_READ | PROT_WRITE, MAP_SHARED, descriptor, 0);
    ::close(descriptor);
    ASSERT_NE(page, MAP_FAILED);
    injection = static_cast<Injection*>(page);
    world.moreEnvironment = {{"LD_PRELOAD", KVR_PROGRAMS "/libkvr-injector.so"},
                             {Injection::kVariable, file.string()}};

    Array items;
    for (const auto* serialNumber : {World::kPhone, World::kFirstWatch}) {
      items.push_back(Dictionary{{"uniqueIdentifier", "com.tarsil.Kavrel." + sha256Hash(serialNumber)}});
    }
    world.directory.write("home/Library/FollowUps/com.tarsil.Kavrel.plist",
                          *writePropertyList(Dictionary{{"items", items}}, PropertyListEncoding::XML));
    world.startAgent();
    World::info(world.newClient(), World::kFirstWatch, World::Refresh);
    world.agent().waitForErrorOutput(" follow-up: ");  // it is brought up to date after the answer
    ASSERT_EQ(world.agent().terminate(), 0);
    fs::copy(library(), world.directory / "saved", fs::copy_options::recursive);
  }
  void TearDown() override {
    if (injection != nullptr) ::munmap(injection, sizeof(Injection));
  }

  fs::path library() const { return world.home() / "Library"; }
  /// Restores a store's initial state; each file is replaced atomically.
  void restore(const Store& store, int round) {
    const auto saved = world.directory / "saved" / store.folder;
    if (!fs::exists(saved)) fs::remove_all(library() / store.folder);
    for (const auto& [file, content] : stateIn(saved)) {
      fs::copy_file(saved / file, world.directory / "restored", fs::copy_options::overwrite_existing);
      fs::rename(world.directory / "restored", library() / store.folder / file);
    }
    store.prepare(world, round);
  }
  /// Restores all stores, while no agent runs.
  void restoreAll() const {
    fs::remove_all(library());
    fs::copy(world.directory / "saved", library(), fs::copy_options::recursive);
  }
  /// Makes the store's calls number `first` to `last` fail, or none if `first` is 0.
  void arm(const std::string& folder, unsigned first = 0, unsigned last = 0, int error = 0) const {
    injection->first = 0;
    injection->path[0] = '\0';
    const std::string path = folder.empty() ? library() : library() / folder;
    ASSERT_LT(path.size(), Injection::kLongestPath);
    std::ranges::copy(path.c_str() + 1, path.c_str() + path.size() + 1, injection->path + 1);
    injection->path[0] = '/';
    for (auto* counter :
         {&injection->calls, &injection->fileSyncs, &injection->directorySyncs, &injection->replacements}) {
      *counter = 0;
    }
    injection->last = last;
    injection->error = error;
    injection->first = first;
  }
  void startAgent() {
    arm("nothing");
    world.waitForName(false);
    world.startAgent();
    world.newClient().call("GetAllDeviceInfosUsingPolicy", "tb", {World::CacheOnly, false});
  }

  State stateOf(const Store& store) const { return stateIn(library() / store.folder); }
  static State stateIn(const fs::path& folder) {
    State state;
    if (!fs::exists(folder)) return state;
    for (const auto& entry : fs::recursive_directory_iterator(folder)) {
      if (entry.is_regular_file() && !isTemporary(entry.path())) {
        state.emplace(entry.path().lexically_relative(folder).string(), contentOf(entry.path()));
      }
    }
    return state;
  }
  static bool isTemporary(const fs::path& path) { return path.filename().string().starts_with("."); }
  std::ptrdiff_t temporaries(const Store& store) const {
    const fs::recursive_directory_iterator all(library() / store.folder);
    return std::count_if(begin(all), end(all), [](const auto& entry) { return isTemporary(entry.path()); });
  }

  /// Checks that each file is the old or the new one; in the preferences file, each single preference.
  static void expectOldOrNew(const State& state, const State& before, const State& after) {
    for (const auto& [file, now] : after) EXPECT_TRUE(!before.contains(file) || state.contains(file)) << file;
    for (const auto& [file, now] : state) {
      ASSERT_TRUE(after.contains(file)) << file;
      const Value last = before.contains(file) ? before.at(file) : Value();
      const Value& next = after.at(file);
      if (!file.ends_with("kvragent.plist") || !now.isDictionary() || now.contains("activities")) {
        EXPECT_TRUE(now == last || now == next) << file << ": " << describe(now);
        continue;
      }
      for (const auto& [key, value] : next.dictionary()) {
        EXPECT_TRUE(now[key] == last[key] || now[key] == value) << key << ": " << describe(now);
      }
    }
  }

  /// The number of the agent's error lines so far. Its output may arrive after its reply, but in order, so a
  /// marker line is awaited first.
  std::size_t errorLines() {
    const auto mark = "MARK" + std::to_string(++marks);
    world.newClient().call("GetDeviceInfoForSerialNumber", "st", {mark, World::CacheOnly});
    world.agent().waitForErrorOutput(mark);
    return countOf(" error com.", world.agent().errorOutput());
  }

  mutable AgentWorld world;
  unsigned marks = 0;
  Injection* injection = nullptr;
};

TEST_F(TheAgentsStores, AreTheOldOrTheNewOnesWhereverItIsKilled) {
  unsigned points = 0;
  for (const auto& store : allStores()) {
    restoreAll();
    store.prepare(world, 0);
    const State before = stateOf(store);
    startAgent();
    arm(store.folder);
    store.change(world.newClient(), 0);
    const unsigned calls = injection->calls;
    const State after = stateOf(store);
    ASSERT_NE(after, before) << store.folder;
    EXPECT_EQ(injection->replacements, store.changes) << store.folder;
    EXPECT_EQ(injection->fileSyncs, store.changes) << store.folder;
    EXPECT_EQ(injection->directorySyncs, store.changes + store.directories) << store.folder;
    world.agent().kill();

    for (unsigned call = 1; call <= calls; ++call, ++points) {
      SCOPED_TRACE(store.folder + ", call " + std::to_string(call) + " of " + std::to_string(calls));
      restoreAll();
      startAgent();
      arm(store.folder, call, call, Injection::kKill);
      store.change(world.newClient(), 0);
      // A file whose stamp has settled is not read again, so fewer calls are made.
      if (injection->calls < call) world.agent().kill();
      ASSERT_EQ(world.agent().wait(), -SIGKILL);
      expectOldOrNew(stateOf(store), before, after);

      startAgent();
      const auto client = world.newClient();
      store.change(client, 0);
      EXPECT_EQ(describe(stateOf(store)), describe(after));
      EXPECT_EQ(temporaries(store), 0);
      EXPECT_EQ(errorLines(), 0U) << world.agent().errorOutput();
      EXPECT_FALSE(World::warrantyIn(World::info(client, World::kFirstWatch, World::CacheOnly)).isNull());
      world.agent().kill();
      if (HasFailure()) return;
    }
  }
  EXPECT_GT(points, 8 * allStores().size());
  RecordProperty("points", static_cast<int>(points));
}

TEST_F(TheAgentsStores, AreTheOldOrTheNewOnesWhateverCallFailsAndNormalWithoutARestart) {
  startAgent();
  const auto client = world.newClient();
  int round = 0;
  unsigned calls = 0;
  /// Makes a change while some calls fail, and again while none does; sets `calls` to the number of
  /// calls made.
  const auto change = [&](const Store& store, unsigned first, unsigned last, int error) {
    SCOPED_TRACE(store.folder + ", call " + std::to_string(first) + ": " + std::strerror(error));
    restore(store, ++round);
    const State before = stateOf(store);
    const auto lines = errorLines();
    arm(store.folder, first, last, error);
    store.change(client, round);
    calls = injection->calls;
    arm("nothing");
    const State found = stateOf(store);
    EXPECT_LE(errorLines(), lines + (first == last ? kMostComplaints : kMostComplaintsOfLasting));
    const auto linesThen = errorLines();
    store.change(client, round);
    expectOldOrNew(found, before, stateOf(store));
    EXPECT_EQ(errorLines(), linesThen);
    EXPECT_EQ(temporaries(store), 0);
    EXPECT_NE(stateOf(store), before);
  };
  unsigned points = 0;
  for (const auto& store : allStores()) {
    for (const int error : {ENOSPC, EIO, EROFS, EMFILE}) {
      unsigned call = 0;
      do {
        ++call;
        if (error == EIO) change(store, call, std::numeric_limits<unsigned>::max(), error);
        change(store, call, call, error);
      } while (calls >= call && !HasFailure());
      points += call - 1;
      if (HasFailure()) return;
    }
  }
  EXPECT_EQ(world.agent().terminate(), 0);
  EXPECT_GT(points, 4 * 8 * allStores().size());
  RecordProperty("points", static_cast<int>(points));
}

TEST_F(TheAgentsStores, AreNotWrittenWhenNothingChanges) {
  startAgent();
  const auto client = world.newClient();
  client.call("DismissFollowUpForSerialNumber", "s", {World::kPhone});
  arm("FollowUps");
  client.call("DismissFollowUpForSerialNumber", "s", {World::kPhone});
  EXPECT_GT(injection->calls, 0U);
  EXPECT_EQ(injection->fileSyncs + injection->directorySyncs + injection->replacements, 0U);
  arm("");
  World::info(client, World::kFirstWatch, World::Default);
  errorLines();
  EXPECT_GT(injection->calls, 0U);
  EXPECT_EQ(injection->fileSyncs + injection->directorySyncs + injection->replacements, 0U);
}

}  // namespace
}  // namespace kvr::testing
