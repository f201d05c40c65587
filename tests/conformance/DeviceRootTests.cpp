#include "conformance/FileWorld.h"
#include "local/device/DeviceRoot.h"
#include "local/device/LocalAccountStore.h"
#include "local/device/LocalDeviceProperties.h"
#include "local/device/LocalEntitlements.h"
#include "local/locale/LocalUserLocale.h"
#include "local/process/LocalProcesses.h"

#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <future>

namespace kvr {
namespace {

namespace fs = std::filesystem;

struct ADevice : ::testing::Test {
  ADevice() { fs::permissions(pathOf(""), fs::perms::owner_all); }

  std::string pathOf(const std::string& file) { return world.path(file); }
  void put(const std::string& file, const Value& tree) {
    world.putTree(pathOf(file), tree, PropertyListEncoding::Binary);
    fs::permissions(pathOf(file), fs::perms::owner_read | fs::perms::owner_write);
  }

  FileWorld world{true};
  SimulatedLog& log = world.log;
  DeviceRoot root{world.lists, log, world.files().homeDirectory()};
};

TEST_F(ADevice, IsTrustedOnlyWhereNobodyElseCanWrite) {
  put("F.plist", Dictionary{{"a", 1}});
  fs::create_directory(pathOf("open"));
  fs::create_symlink("open/F.plist", pathOf("linked.plist"));
  put("open/F.plist", Dictionary{{"a", 1}});
  const std::tuple<const char*, mode_t, const char*, const char*> cases[] = {
      {"F.plist", 0600, "F.plist", nullptr},
      {"F.plist", 0620, "F.plist", "by group"},
      {"F.plist", 0602, "F.plist", "by everyone"},
      {"F.plist", 0600, "F.plist", nullptr},
      {"", 01777, "F.plist", "by everyone"},
      {"", 0755, "F.plist", nullptr},
      {"open", 0777, "linked.plist", "by everyone"},
      {"open", 0700, "linked.plist", nullptr},
      {"open/F.plist", 0666, "linked.plist", "by everyone"}};
  for (const auto& [changed, mode, asked, reason] : cases) {
    SCOPED_TRACE(std::string(changed) + " " + std::to_string(mode));
    log.clear();
    ASSERT_EQ(::chmod(pathOf(changed).c_str(), mode), 0);
    for (int i = 0; i < 2; ++i) EXPECT_EQ(root.trustedDictionary(asked).isNull(), reason != nullptr);
    EXPECT_THAT(world.errors(), SizeIs(reason != nullptr ? 1 : 0));
    EXPECT_THAT(world.errors(), Each(HasSubstr(reason != nullptr ? reason : "")));
  }
  EXPECT_TRUE(root.trustedDictionary("missing.plist").isNull());
}

TEST_F(ADevice, HasThePropertiesStatedElseThoseOfItsHost) {
  const std::string host = pathOf("host");
  const LocalDeviceProperties properties(root, host);
  const auto answers = [&] {
    return describe(properties.answer(DeviceProperties::kSerialNumber)) + ", " +
           describe(properties.answer(DeviceProperties::kProductType)) + ", " +
           describe(properties.answer(DeviceProperties::kProductVersion));
  };
  EXPECT_EQ(answers(), "(null), (null), (null)");
  writeFile(host + "/sys/class/dmi/id/product_serial", "To Be Filled By O.E.M.\n");
  writeFile(host + "/proc/device-tree/serial-number", std::string("10000000abc\0", 12));
  writeFile(host + "/sys/class/dmi/id/product_name", " Phone 14 \n");
  writeFile(host + "/usr/lib/os-release", "VERSION_ID=1\n");
  EXPECT_EQ(answers(), "10000000abc, Phone 14, 1");
  writeFile(host + "/etc/os-release", "NAME='x'\nMY_VERSION_ID=3\nVERSION_ID=\"12.1\"\nVERSION_IDS=4");
  EXPECT_EQ(answers(), "10000000abc, Phone 14, 12.1");
  put("DeviceProperties.plist",
      Dictionary{{"SerialNumber", "S1"}, {"ProductType", 7}, {"InternalInstall", 1}});
  EXPECT_EQ(answers(), "S1, Phone 14, 12.1");
  EXPECT_FALSE(properties.isInternalInstall());
  put("DeviceProperties.plist", Dictionary{{"UserAssignedDeviceName", "Ann's"}, {"InternalInstall", true}});
  EXPECT_TRUE(properties.isInternalInstall());
  EXPECT_EQ(properties.answer("UserAssignedDeviceName"), "Ann's");
  EXPECT_EQ(properties.answer("InternalInstall"), std::nullopt);
  EXPECT_THAT(world.errors(), IsEmpty());
}

TEST_F(ADevice, EntitlesTheFilesThatThePathsLeadTo) {
  const LocalEntitlements entitlements(root);
  writeFile(pathOf("program"), "1");
  writeFile(pathOf("copy"), "1");
  const auto valueOf = [&](const std::string& program, std::string_view entitlement) {
    return entitlements.valueFor(*FileIdentity::of(pathOf(program)), entitlement);
  };
  EXPECT_TRUE(valueOf("program", "one").isNull());
  put("Entitlements.plist", Dictionary{{pathOf("missing"), Dictionary{{"one", false}}},
                                       {pathOf("program"), Dictionary{{"one", 1}}},
                                       {"program", Dictionary{{"relative", true}}},
                                       {pathOf("copy"), "not a dictionary"}});
  EXPECT_EQ(valueOf("program", "one").kind(), Value::Kind::Int);
  EXPECT_TRUE(valueOf("program", "relative").isNull());
  EXPECT_TRUE(valueOf("copy", "one").isNull());
}

TEST_F(ADevice, KnowsProgramsAndTheBundlesAroundThem) {
  const LocalProcesses processes(world.lists);
  std::array<char, 4096> buffer{};
  const auto length = processes.executablePath(::getpid(), buffer);
  ASSERT_GT(length, 0);
  EXPECT_EQ(std::string(buffer.data(), static_cast<std::size_t>(length)), fs::read_symlink("/proc/self/exe"));
  EXPECT_LE(processes.executablePath(::getpid(), std::span(buffer).first(static_cast<std::size_t>(length))),
            0);
  EXPECT_LE(processes.executablePath(-1, buffer), 0);

  put("Apps/Outer/Info.plist", Dictionary{{"BundleIdentifier", "outer"}});
  put("Apps/Outer/Parts/Info.plist", Dictionary{{"BundleIdentifier", 1}});
  EXPECT_EQ(processes.bundleLocationForExecutable(pathOf("Apps/Outer/Parts/bin/program")),
            pathOf("Apps/Outer"));
  EXPECT_EQ(processes.bundleLocationForExecutable(pathOf("Apps/program")), std::nullopt);
  EXPECT_EQ(processes.bundleLocationForExecutable("program"), std::nullopt);
  EXPECT_EQ(processes.bundleAt(pathOf("Apps/Outer"))->identifier, "outer");
  EXPECT_EQ(processes.bundleAt(pathOf("Apps/Outer/Parts"))->identifier, std::nullopt);
  EXPECT_FALSE(processes.bundleAt(pathOf("Apps")));
}

TEST_F(ADevice, GivesNoPathForAProgramThatIsNoLongerThere) {
  const LocalProcesses processes(world.lists);
  std::string program = pathOf("program (deleted)");
  fs::copy_file("/bin/sleep", program);
  std::string forever = "infinity";
  char* const arguments[] = {program.data(), forever.data(), nullptr};
  pid_t child = 0;
  ASSERT_EQ(::posix_spawn(&child, program.c_str(), nullptr, nullptr, arguments, nullptr), 0);
  std::array<char, 4096> buffer{};
  EXPECT_EQ(processes.executablePath(child, buffer), static_cast<std::int64_t>(program.size()));
  fs::remove(program);
  EXPECT_LE(processes.executablePath(child, buffer), 0);
  writeFile(program + " (deleted)", "another file");
  EXPECT_LE(processes.executablePath(child, buffer), 0);
  ::kill(child, SIGKILL);
  ::waitpid(child, nullptr, 0);
}

TEST_F(ADevice, SpeaksTheLanguageStatedElseThatOfTheEnvironment) {
  const LocalUserLocale locale(root, log);
  const std::pair<std::array<const char*, 3>, const char*> cases[] = {
      {{"", "", "de_DE.UTF-8"}, "de_DE"},
      {{"", "fr_FR@euro", "de_DE"}, "fr_FR"},
      {{"ja_JP.eucJP@x", "fr_FR", "de_DE"}, "ja_JP"},
      {{"C", "fr_FR", "de_DE"}, "en_US"},
      {{"../../etc", "", ""}, "en_US"}};
  for (const auto& [values, identifier] : cases) {
    ::setenv("LC_ALL", values[0], 1);
    ::setenv("LC_MESSAGES", values[1], 1);
    ::setenv("LANG", values[2], 1);
    EXPECT_EQ(locale.preferredIdentifier(), identifier);
  }
  ::setenv("LC_ALL", "it_IT", 1);
  for (const auto& unusable : Array{1, "", "a/b", "en_US\r\nX: y"}) {
    put("Locale.plist", Dictionary{{"identifier", unusable}});
    EXPECT_EQ(locale.preferredIdentifier(), "it_IT");
  }
  const std::pair<const char*, const char*> numbers[] = {{"en_US", "18,446,744,073,709,551,615"},
                                                         {"de_DE", "18.446.744.073.709.551.615"},
                                                         {"en_IN", "1,84,46,74,40,73,70,95,51,615"}};
  for (const auto& [identifier, text] : numbers) {
    put("Locale.plist", Dictionary{{"identifier", identifier}});
    EXPECT_EQ(locale.decimalString(std::numeric_limits<std::uint64_t>::max()), text);
  }
  for (const auto* name : {"LC_ALL", "LC_MESSAGES", "LANG"}) ::unsetenv(name);
  EXPECT_THAT(world.errors(), IsEmpty());
}

TEST_F(ADevice, KnowsTheOffsetOfEveryZoneAtEveryDate) {
  const LocalUserLocale locale(root, log);
  const Date spring{1774746000}, autumn{1792890000};  // 2026-03-29 and 2026-10-25, 01:00 UTC
  const std::tuple<const char*, Date, long> cases[] = {{"UTC", spring, 0},
                                                       {"Europe/Berlin", spring + -1, 3600},
                                                       {"Europe/Berlin", spring, 7200},
                                                       {"Europe/Berlin", autumn + -1, 7200},
                                                       {"Europe/Berlin", autumn, 3600},
                                                       {"Asia/Kolkata", spring, 19800},
                                                       {"America/St_Johns", spring, -9000},
                                                       {"America/St_Johns", autumn + 30 * kDay, -12600},
                                                       {"Nowhere/Known", spring, 0},
                                                       {"UTC", Date{kInfinity}, 0},
                                                       {"UTC", Date{std::nan("")}, 0}};
  for (const auto& [zone, date, offset] : cases) {
    ::setenv("TZ", zone, 1);
    EXPECT_EQ(locale.secondsFromGMT(date), offset) << zone << " " << describe(date);
  }
  ::unsetenv("TZ");
}

struct AnAccount : ADevice {
  using Outcome = std::pair<std::int64_t, std::string>;

  static Value tree(const Value& renewal, const std::string& altDSID = "alt") {
    const Value tokens = Dictionary{{"s", "held"}, {"number", 1}};
    const Value account = Dictionary{{"alternateDSID", "auth"}, {"tokens", tokens}, {"renewal", renewal}};
    return Dictionary{{"primaryAccount", Dictionary{{"altDSID", altDSID},
                                                    {"storeAccountIdentifier", 42},
                                                    {"storefront", "143441"},
                                                    {"authenticationAccount", account}}}};
  }
  std::future<Outcome> renew(AccountStore& store) const {
    auto promise = std::make_shared<std::promise<Outcome>>();
    store.renewCredentialsFor(account, {}, [promise](std::int64_t code, const std::optional<Error>& error) {
      promise->set_value({code, error ? error->message : ""});
    });
    return promise->get_future();
  }

  const AuthenticationAccount account{"auth"};
};

TEST_F(AnAccount, IsTheOneThatTheFileHolds) {
  const LocalAccountStore store(root, log);
  EXPECT_FALSE(store.primaryAccount());
  put("Accounts.plist", tree({}));
  const auto cloud = store.primaryAccount();
  ASSERT_TRUE(cloud);
  EXPECT_EQ(store.authenticationAccountFor(*cloud)->alternateDSID, "auth");
  EXPECT_EQ(store.storeAccountFor(*cloud)->identifier, 42);
  EXPECT_EQ(store.tokenFor(account, "number"), std::nullopt);
  EXPECT_EQ(store.tokenFor({"another"}, "s"), std::nullopt);
  put("Accounts.plist", tree({}, "another"));
  EXPECT_FALSE(store.authenticationAccountFor(*cloud));
  EXPECT_FALSE(store.storeAccountFor(*cloud));
  put("Accounts.plist", Dictionary{{"primaryAccount", Dictionary{{"altDSID", 1}, {"storefront", 2}}}});
  EXPECT_EQ(store.primaryAccount()->altDSID, std::nullopt);
  EXPECT_FALSE(store.authenticationAccountFor({}));
  EXPECT_FALSE(store.storeAccountFor({}));
  EXPECT_THAT(world.errors(), IsEmpty());
  fs::permissions(pathOf("Accounts.plist"), fs::perms::group_write, fs::perm_options::add);
  EXPECT_FALSE(store.primaryAccount());
  EXPECT_THAT(world.errors(), SizeIs(1));
}

TEST_F(AnAccount, IsRenewedAsScriptedUntilTheFileChanges) {
  const Value tokens = Dictionary{{"s", "new"}, {"t", 1}};
  const std::tuple<Value, Outcome, std::string> cases[] = {
      {{}, {1, "there is no renewal service for the account"}, "held"},
      {Dictionary{{"resultCode", 0}, {"tokens", tokens}, {"delay", -1}}, {0, ""}, "new"},
      {Dictionary{{"tokens", tokens}, {"delay", NAN}, {"error", "still"}}, {0, "still"}, "new"},
      {Dictionary{{"resultCode", -7}, {"tokens", tokens}, {"error", "no"}}, {-7, "no"}, "held"}};
  LocalAccountStore store(root, log);
  for (const auto& [renewal, outcome, token] : cases) {
    put("Accounts.plist", tree(renewal));
    EXPECT_EQ(store.tokenFor(account, "s"), "held");
    EXPECT_EQ(renew(store).get(), outcome);
    EXPECT_EQ(store.tokenFor(account, "s"), token);
    EXPECT_EQ(LocalAccountStore(root, log).tokenFor(account, "s"), "held");
  }
}

TEST_F(AnAccount, IsNotRenewedWhenTheStoreGoesFirst) {
  put("Accounts.plist", tree(Dictionary{{"delay", 1e300}}));
  auto store = std::make_unique<LocalAccountStore>(root, log);
  auto late = renew(*store);
  store.reset();
  EXPECT_EQ(late.get(), Outcome(LocalAccountStore::kEnding, "the agent is ending"));
}

}  // namespace
}  // namespace kvr
