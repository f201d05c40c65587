#include "conformance/FileWorld.h"
#include "local/system/Descriptor.h"
#include "local/system/LocalLog.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <regex>

namespace kvr {
namespace {

using Expected = PropertyListFiles::Expected;
using WhenDamaged = PropertyListFiles::WhenDamaged;

std::int64_t codeOf(const std::optional<Error>& error) { return error ? error->code : 0; }

template <class T>
std::int64_t codeOf(const Result<T>& result) {
  return result ? 0 : result.error().code;
}

std::string bytesOf(const Value& tree) { return *writePropertyList(tree, PropertyListEncoding::Binary); }

class AFile : public InBothWorlds {};
INSTANTIATE_TEST_SUITE_P(, AFile, ::testing::Bool(), AFile::nameOf);

TEST_P(AFile, IsReplacedAsAWholeAndReadWithinALimit) {
  const auto path = world.path("file");
  auto& files = world.files();
  const auto missing = files.read(path, 10);
  ASSERT_TRUE(missing);
  EXPECT_FALSE(*missing);
  EXPECT_EQ(*files.stamp(path), std::nullopt);
  std::optional<FileStamp> last;
  for (const auto& bytes : {std::string(), std::string("a\0b", 3), std::string(10, 'x')}) {
    ASSERT_EQ(codeOf(files.replace(path, bytes)), 0);
    const auto contents = files.read(path, 10);
    ASSERT_TRUE(contents && *contents);
    EXPECT_EQ((*contents)->bytes, bytes);
    EXPECT_EQ((*contents)->stamp.size, bytes.size());
    EXPECT_NE((*contents)->stamp, last);
    last = (*contents)->stamp;
  }
  EXPECT_EQ(codeOf(files.read(path, 9)), EFBIG);
  EXPECT_THAT(world.names(), ElementsAre("file"));
}

TEST_P(AFile, IsNotMadeOfWhatIsNoPlainFile) {
  auto& files = world.files();
  ASSERT_EQ(codeOf(files.createDirectory(world.path("a/b"))), 0);
  EXPECT_EQ(codeOf(files.createDirectory(world.path("a/b"))), 0);
  world.put(world.path("file"), "x");
  EXPECT_EQ(codeOf(files.read(world.path("a"), 10)), EISDIR);
  EXPECT_EQ(codeOf(files.replace(world.path("a"), "x")), EISDIR);
  EXPECT_EQ(codeOf(files.replace(world.path("missing/file"), "x")), ENOENT);
  EXPECT_EQ(codeOf(files.createDirectory(world.path("file/below"))), ENOTDIR);
  EXPECT_EQ(codeOf(files.createDirectory(world.path("file"))), ENOTDIR);
  EXPECT_EQ(world.get(world.path("file")), "x");
}

TEST_P(AFile, IsRenamedOverAnotherOnlyWhereThatIsAsked) {
  auto& files = world.files();
  const std::string a = world.path("a");
  const std::string b = world.path("b");
  world.put(a, "1");
  world.put(b, "2");
  EXPECT_EQ(codeOf(files.renameToUnused(a, b)), EEXIST);
  EXPECT_EQ(world.get(b), "2");
  EXPECT_EQ(codeOf(files.rename(a, b)), 0);
  EXPECT_EQ(world.get(b), "1");
  EXPECT_EQ(codeOf(files.rename(a, b)), ENOENT);
  EXPECT_EQ(codeOf(files.renameToUnused(b, a)), 0);
  EXPECT_EQ(codeOf(files.remove(a)), 0);
  EXPECT_EQ(codeOf(files.remove(a)), ENOENT);
  EXPECT_THAT(world.names(), IsEmpty());
}

struct APropertyListFile : InBothWorlds {
  Value read(WhenDamaged whenDamaged = WhenDamaged::SetAside, Expected expected = Expected::Dictionary) {
    const auto tree = lists.read(path, expected, whenDamaged);
    EXPECT_TRUE(tree) << describe(tree.error());
    return tree ? *tree : Value();
  }

  const std::string path = world.path("list.plist");
  PropertyListFiles& lists = world.lists;
};
INSTANTIATE_TEST_SUITE_P(, APropertyListFile, ::testing::Bool(), APropertyListFile::nameOf);

TEST_P(APropertyListFile, IsReadAsItIsNow) {
  EXPECT_TRUE(read().isNull());
  // Write contents of equal size in quick succession: no stamp may hide a change.
  for (int round = 0; round < 50; ++round) {
    world.put(path, bytesOf(Dictionary{{"round", round}}));
    EXPECT_EQ(read()["round"], Value(round));
  }
  world.erase(path);
  EXPECT_TRUE(read().isNull());
  EXPECT_THAT(world.log.lines(), IsEmpty());
}

TEST_P(APropertyListFile, IsSetAsideUnderANameOfItsOwnWhenItIsDamaged) {
  ASSERT_EQ(codeOf(lists.write(path, Dictionary{}, PropertyListEncoding::XML)), 0);
  const std::string damaged[] = {"", "garbage {", bytesOf(Array{1}), bytesOf(Value("text"))};
  for (const auto& bytes : damaged) {
    world.put(path, bytes);
    EXPECT_TRUE(read().isNull());
    EXPECT_TRUE(read().isNull());
  }
  const std::string name = "list.plist.damaged-20261124T160443Z";
  EXPECT_THAT(world.names(), ElementsAre(name, name + "-2", name + "-3", name + "-4"));
  EXPECT_EQ(world.get(world.path(name + "-2")), damaged[1]);
  const auto errors = world.errors();
  ASSERT_THAT(errors, SizeIs(4));
  EXPECT_THAT(errors[2], HasSubstr(path + " is damaged (the top level is not a dictionary): set aside as "));
}

TEST_P(APropertyListFile, IsLeftAndReportedOnceAStateWhereItIsNotOurs) {
  const auto complaintsAfter = [&](const std::string& bytes) {
    world.put(path, bytes);
    for (int round = 0; round < 2; ++round) EXPECT_TRUE(read(WhenDamaged::Leave).isNull());
    return world.errors().size();
  };
  EXPECT_EQ(complaintsAfter("garbage {"), 1U);
  EXPECT_EQ(complaintsAfter(bytesOf(Array{1})), 2U);
  EXPECT_EQ(read(WhenDamaged::Leave, Expected::Array), Value(Array{1}));
  EXPECT_EQ(complaintsAfter("garbage {"), 3U);
  EXPECT_THAT(world.names(), ElementsAre("list.plist"));
}

TEST_P(APropertyListFile, IsAnErrorReportedOnceWhileItCannotBeRead) {
  for (const std::size_t complaints : {1U, 2U}) {
    world.put(path, std::string(PropertyListFiles::kLimit + 1, ' '));
    for (int round = 0; round < 2; ++round) {
      EXPECT_EQ(codeOf(lists.read(path, Expected::Dictionary, WhenDamaged::SetAside)), EFBIG);
    }
    EXPECT_THAT(world.errors(), SizeIs(complaints));
    world.put(path, bytesOf(Dictionary{{"a", 1}}));
    EXPECT_EQ(read()["a"], Value(1));
  }
  EXPECT_THAT(world.names(), ElementsAre("list.plist"));
}

TEST_P(APropertyListFile, KeepsItsContentWhenANewOneCannotBeWritten) {
  ASSERT_EQ(codeOf(lists.write(path, Dictionary{{"a", 1}}, PropertyListEncoding::XML)), 0);
  EXPECT_TRUE(lists.write(path, Dictionary{{"a", Value()}}, PropertyListEncoding::XML));
  const std::string large(PropertyListFiles::kLimit, 'x');
  EXPECT_EQ(codeOf(lists.write(path, Dictionary{{"a", large}}, PropertyListEncoding::Binary)), EFBIG);
  EXPECT_EQ(read()["a"], Value(1));
}

struct ASimulatedPropertyListFile : ::testing::Test {
  SimulatedClock clock;
  SimulatedLog log;
  SimulatedFiles files{clock};
  PropertyListFiles lists{files, clock, log};
};

TEST_F(ASimulatedPropertyListFile, IsParsedOnceWhileTheMemoryForItLastsAndItIsUnchanged) {
  const auto isReadAgain = [&](const std::string& path) {
    const auto before = files.readCount();
    EXPECT_TRUE(lists.read(path, Expected::Dictionary, WhenDamaged::Leave));
    return files.readCount() != before;
  };
  const auto large = bytesOf(Dictionary{{"text", std::string(1500 * 1024, 'x')}});
  for (const auto* path : {"/a", "/b", "/c"}) files.put(path, large);
  files.put("/damaged", "garbage {");
  const std::pair<const char*, bool> reads[] = {
      {"/a", true},  {"/damaged", true}, {"/damaged", false},
      {"/b", true},  {"/a", false},      {"/c", true},  // replaces the least recently used one
      {"/a", false}, {"/b", true}};
  for (const auto& [path, again] : reads) EXPECT_EQ(isReadAgain(path), again) << path;
}

TEST_F(ASimulatedPropertyListFile, IsNotOverwrittenWhenItIsDamagedAndCannotBeSetAside) {
  files.put("/a", "garbage {");
  files.setWriteFault("/a", Error{"files", EROFS, "read-only"});
  for (int round = 0; round < 2; ++round) {
    EXPECT_EQ(codeOf(lists.read("/a", Expected::Dictionary, WhenDamaged::SetAside)), EROFS);
  }
  EXPECT_THAT(log.texts(LogLevel::Error), ElementsAre(HasSubstr("not set aside: read-only")));
  EXPECT_EQ(files.get("/a"), "garbage {");
}

struct LocalFilesOf : ::testing::Test {
  TemporaryDirectory directory;
  const std::string home = directory.path().string();
  SimulatedLog log;
  LocalFiles files{log, home + "/", 0.01};
};

TEST_F(LocalFilesOf, OtherKindsThanPlainOnesAreRefusedWithoutWaiting) {
  ASSERT_EQ(::mkfifo((home + "/fifo").c_str(), 0600), 0);
  EXPECT_EQ(codeOf(files.read(home + "/fifo", 10)), EINVAL);
  EXPECT_EQ(codeOf(files.replace(home + "/fifo", "x")), EINVAL);
  EXPECT_EQ(codeOf(files.stamp(home + "/fifo")), EINVAL);
  EXPECT_EQ(codeOf(files.read("/dev/zero", 10)), EINVAL);
  EXPECT_EQ(codeOf(files.read("relative", 10)), EINVAL);
  EXPECT_EQ(codeOf(files.replace(home + std::string("/a\0b", 4), "x")), EINVAL);
  // Files in /proc report size 0.
  EXPECT_TRUE(*files.read("/proc/self/status", 65536));
  EXPECT_THAT(namesIn(home), ElementsAre("fifo"));
}

TEST_F(LocalFilesOf, AStampSettlesOnlyWhenItsTimeHasPassed) {
  ASSERT_EQ(codeOf(files.replace(home + "/file", "x")), 0);
  EXPECT_TRUE((*files.stamp("/etc/passwd"))->settled);
  const timespec future[2] = {{4102444800, 0}, {4102444800, 0}};
  ASSERT_EQ(::utimensat(AT_FDCWD, (home + "/file").c_str(), future, 0), 0);
  EXPECT_FALSE((*files.stamp(home + "/file"))->settled);
  EXPECT_FALSE((*files.read(home + "/file", 10))->stamp.settled);
}

TEST_F(LocalFilesOf, AKilledProcessGoWhileALivingOnesStay) {
  writeFile(home + "/.list.plist.kvr-abcdef", "half");
  writeFile(home + "/.list.plist.abcdef", "another program's");
  writeFile(home + "/.list.plist.kvr-ghijkl", "being written");
  const Descriptor writer(::open((home + "/.list.plist.kvr-ghijkl").c_str(), O_RDWR | O_CLOEXEC));
  ASSERT_EQ(::flock(writer.get(), LOCK_EX), 0);
  ASSERT_EQ(codeOf(files.replace(home + "/list.plist", "x")), 0);
  EXPECT_THAT(namesIn(home), ElementsAre(".list.plist.abcdef", ".list.plist.kvr-ghijkl", "list.plist"));
}

TEST_F(LocalFilesOf, ADirectoryAreLockedAgainstOtherProcessesWhileThatIsPossible) {
  const auto folder = home + "/new";
  const auto isLocked = [&] {
    const Descriptor other(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return ::flock(other.get(), LOCK_EX | LOCK_NB) != 0;
  };
  {
    const auto lock = files.lock(folder);
    { const auto again = files.lock(folder); }
    EXPECT_TRUE(isLocked());
  }
  EXPECT_FALSE(isLocked());
  {
    const Descriptor hung(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    ASSERT_EQ(::flock(hung.get(), LOCK_EX), 0);
    for (int round = 0; round < 2; ++round) EXPECT_TRUE(files.lock(folder));
    EXPECT_THAT(log.texts(LogLevel::Error), ElementsAre(HasSubstr(folder)));
  }
  const auto lock = files.lock(folder);
  EXPECT_TRUE(isLocked());
}

struct ALogLine : ::testing::Test {
  std::string written() const { return contentOfFile(path).value_or(""); }

  TemporaryDirectory directory;
  const std::string path = directory.path().string() + "/log";
  const Descriptor descriptor{::open(path.c_str(), O_CREAT | O_WRONLY | O_APPEND | O_CLOEXEC, 0600)};
};

TEST_F(ALogLine, NamesTimeLevelAndChannelAndStaysOneLine) {
  LocalLog log(LogLevel::Debug, false, LocalLog::Sink::Lines, descriptor.get());
  const std::pair<std::string, std::string> cases[] = {
      {"", ""},
      {"caf\u00e9\twith a tab and a \\n", "caf\u00e9\twith a tab and a \\n"},
      {"two\nlines\r\nand\rmore", "two\\nlines\\r\\nand\\rmore"},
      {"\x1b[2J\x7f\v" + std::string(1, '\0'), "\\x1b[2J\\x7f\\x0b\\x00"},
      {"\u0085\u2028\u2029\u2027\xe2\x80", "\\xc2\\x85\\xe2\\x80\\xa8\\xe2\\x80\\xa9\u2027\xe2\x80"},
      {std::string(100000, 'x'), std::string(100000, 'x')}};
  for (const auto& [message, text] : cases) {
    ASSERT_EQ(::ftruncate(descriptor.get(), 0), 0);
    log.standard("%s", message);
    const std::string line = written();
    const auto space = line.find(' ');
    EXPECT_TRUE(std::regex_match(line.substr(0, space),
                                 std::regex("\\d{4}-\\d\\d-\\d\\dT\\d\\d:\\d\\d:\\d\\d\\.\\d{6}Z")));
    EXPECT_EQ(line.substr(space), " default com.tarsil.Kavrel:core " + text + "\n");
  }
}

TEST_F(ALogLine, OfAnySizeWaitsForNoReaderThatHasStopped) {
  int ends[2];
  ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
  const Descriptor reader(ends[0]), writer(ends[1]);
  LocalLog log(LogLevel::Debug, false, LocalLog::Sink::Lines, writer.get());
  log.standard("%s", std::string(1 << 20, 'x'));
  log.standard("lost");
  std::string taken(1 << 20, '\0');
  taken.resize(static_cast<std::size_t>(::read(reader.get(), taken.data(), taken.size())));
  log.standard("later");
  char line[200];
  const auto size = ::read(reader.get(), line, sizeof line);
  EXPECT_TRUE(std::regex_match(std::string(line, static_cast<std::size_t>(size)),
                               std::regex("\n\\S+ default com.tarsil.Kavrel:core later\n")));
}

TEST_F(ALogLine, IsWrittenAtTheLevelsAndInTheClearnessThatTheEnvironmentNames) {
  const Descriptor standardError(::dup(STDERR_FILENO));
  const auto linesWith = [&](const char* level, const char* isPrivate, const char* journal) {
    ::setenv("KVR_LOG_LEVEL", level, 1);
    ::setenv("KVR_LOG_PRIVATE", isPrivate, 1);
    ::setenv("JOURNAL_STREAM", journal, 1);
    ::dup2(descriptor.get(), STDERR_FILENO);
    EXPECT_EQ(::ftruncate(descriptor.get(), 0), 0);
    {
      const auto log = LocalLog::fromEnvironment();
      log->debug("d %{private}@", "secret");
      log->standard("s");
      log->error("e");
    }
    ::dup2(standardError.get(), STDERR_FILENO);
    for (const auto* name : {"KVR_LOG_LEVEL", "KVR_LOG_PRIVATE", "JOURNAL_STREAM"}) ::unsetenv(name);
    return std::regex_replace(written(), std::regex("\\S+ (\\w+) \\S+ ([^\n]*)\n"), "$1:$2;");
  };
  EXPECT_EQ(linesWith("debug", "1", "1:1"), "debug:d secret;default:s;error:e;");
  EXPECT_EQ(linesWith("debug", "yes", ""), "debug:d <private>;default:s;error:e;");
  EXPECT_EQ(linesWith("", "", "nonsense"), "default:s;error:e;");
  EXPECT_EQ(linesWith("error", "", ""), "error:e;");
}

}  // namespace
}  // namespace kvr
