// What the agent learns from the host and tells it, with files of the host replaced for the agent alone.
#include "integration/support/AgentWorld.h"
#include "integration/support/DatagramSocket.h"
#include "platform/codec/JSON.h"

#include <unistd.h>

#include <future>

namespace kvr::testing {
namespace {

namespace fs = std::filesystem;

struct TheAgentOnItsHost : ::testing::Test {
  void SetUp() override {
    if (::geteuid() != 0) GTEST_SKIP() << "replacing a file of the host takes root";
    world.mayMount = true;
  }
  /// Puts a file of the test in the place of one of the host.
  void replace(const std::string& hosts, const std::string& file) {
    world.prologue += "mount --bind '" + (world.directory / file).string() + "' " + hosts + "\n";
  }

  /// Has the agent write to a journal that the test reads.
  void replaceJournal() {
    world.prologue =
        "mount -t tmpfs run /run; mkdir -p /run/systemd/journal; : >/run/systemd/journal/socket\n"
        "export JOURNAL_STREAM=$(stat -L -c %d:%i /dev/stderr)\n";
    replace("/run/systemd/journal/socket", "journal");
  }

  AgentWorld world;
};

/// The fields of an entry in the journal's own format: "NAME=value" or, for a value with line breaks, the
/// name, a line break, the length in eight bytes, and the value.
std::map<std::string, std::string> fieldsOf(std::string_view entry) {
  std::map<std::string, std::string> fields;
  while (!entry.empty()) {
    const auto end = entry.find_first_of("=\n");
    const std::string name(entry.substr(0, end));
    entry.remove_prefix(end);
    std::size_t size = entry.find('\n') - 1;
    if (entry.front() == '\n') {
      size = static_cast<unsigned char>(entry[1]);
      entry.remove_prefix(sizeof(std::uint64_t));
    }
    fields[name] = entry.substr(1, size);
    entry.remove_prefix(size + 2);
  }
  return fields;
}

TEST_F(TheAgentOnItsHost, WritesToTheJournalWhereItsErrorOutputLeadsThere) {
  const DatagramSocket journal(world.directory / "journal");
  replaceJournal();
  world.moreEnvironment = {{"KVR_LOG_LEVEL", "debug"}};
  world.directory.write("device/Network.plist", "damaged");
  const std::string call = "getting warranty using policy two\nlines: 1";
  const std::pair<std::string, const char*> entries[] = {
      {"launched", "5"}, {"Network.plist is damaged", "3"}, {call, "5"}};
  // The socket holds a few entries only, so they are read from the beginning.
  auto reading = std::async(std::launch::async, [&] {
    for (const auto& [message, priority] : entries) {
      auto fields = fieldsOf(journal.receive());
      while (fields["MESSAGE"].find(message) == std::string::npos) fields = fieldsOf(journal.receive());
      fields.erase("MESSAGE");
      EXPECT_THAT(fields,
                  UnorderedElementsAre(Pair("SYSLOG_IDENTIFIER", "kvragent"), Pair("PRIORITY", priority),
                                       Pair("SUBSYSTEM", "com.tarsil.Kavrel"), Pair("CATEGORY", "core")));
    }
  });
  world.startAgent();
  const auto client = world.newClient();
  client.send("GetDeviceInfoForSerialNumber", "st", {"two\nlines", World::CacheOnly});
  reading.get();
  EXPECT_EQ(world.agent().errorOutput(), "");
}

TEST_F(TheAgentOnItsHost, AnswersWhileTheJournalHasStoppedReadingAndWritesAgainAfterwards) {
  const DatagramSocket journal(world.directory / "journal");
  replaceJournal();
  world.startAgent();
  const auto client = world.newClient();
  // Each call makes more entries than the socket holds.
  for (int call = 0; call < 3; ++call) World::info(client, World::kFirstWatch, World::CacheOnly);
  while (journal.hasMessage()) journal.receive();
  const std::string large(500'000, 'x');
  client.send("GetDeviceInfoForSerialNumber", "st", {large, World::CacheOnly});
  auto entry = journal.receive();
  while (entry.find(large) == std::string::npos) entry = journal.receive();
  EXPECT_THAT(entry, ::testing::StartsWith("MESSAGE="));
}

TEST_F(TheAgentOnItsHost, FollowsTheTimeZone) {
  const auto setZone = [this](const char* zone, int age) {
    const auto path = world.directory.write("zone", *contentOfFile(fs::path("/usr/share/zoneinfo") / zone));
    // The C library compares whole seconds.
    fs::last_write_time(path, fs::file_time_type::clock::now() - std::chrono::hours(age));
  };
  setZone("Asia/Kolkata", 2);
  replace("/etc/localtime", "zone");
  world.moreEnvironment = {{"TZ", ""}};
  world.startAgent();
  const auto client = world.newClient();
  const auto zoneInRequest = [&] {
    World::info(client, World::kFirstWatch, World::Refresh);
    return (*readJSON(world.coverageRequests().back()["body"].string()))["requestTimezone"];
  };
  EXPECT_EQ(zoneInRequest(), Value(5));
  setZone("Pacific/Marquesas", 1);
  EXPECT_EQ(zoneInRequest(), Value(-9));
}

TEST_F(TheAgentOnItsHost, LeavesToComeBackInTheHostsNewLanguage) {
  fs::remove(world.directory / "device/Locale.plist");
  world.directory.write("etc/locale", "LANG=en_US.UTF-8\n");
  replace("/etc/default", "etc");
  world.prologue += "export SYSTEMD_EXEC_PID=$$";
  world.startAgent();
  world.directory.write("etc/locale", "LANG=fr_FR.UTF-8\n");
  EXPECT_EQ(world.agent().wait(), EXIT_SUCCESS);
}

}  // namespace
}  // namespace kvr::testing
