#include "integration/KvrctlFixture.h"
#include "platform/codec/PropertyList.h"

#include <cstdlib>

// What people read, byte for byte: the whole output of the real client about one described world, at one
// moment, compared with the files in `goldens`. After a change that is meant, look at the difference and
// renew them:
//
//     KVR_RENEW_GOLDENS=1 integration_tests --gtest_filter='TheOutput.*'

namespace kvr::testing {
namespace {

namespace fs = std::filesystem;

struct Reader {
  std::string locale;
  std::string zone;
  std::string columns;  ///< of the terminal; empty for none
};

const std::string kBerlin = "CET-1CEST,M3.5.0,M10.5.0/3";
const Reader kBriton{"en_GB.UTF-8", "UTC", "80"};

struct TheOutput : Kvrctl {
  void SetUp() override {
    if (KVR_SANITIZED) GTEST_SKIP() << "a sanitizer's runtime stands before the injector's calls";
    fs::copy(fs::path(KVR_GOLDENS) / "world", home.path(), fs::copy_options::recursive);
    fs::current_path(home.path());  // so that every path in the output is a relative one
    const auto answers = readPropertyList(*contentOfFile("answers.plist"));
    for (const auto& [member, answer] : answers->dictionary()) setAnswer(member, answer);
    serving_ = serveAgent();
  }
  void TearDown() override { fs::current_path("/"); }

  ChildProcess::Environment environmentFor(const Reader& reader) const {
    return {{"DBUS_SESSION_BUS_ADDRESS", bus.address()},
            {"HOME", "home"},
            {"KVR_DEVICE_ROOT", "device"},
            {"TERM", "xterm"},
            {"NO_COLOR", ""},
            {"LOCPATH", KVR_LOCALES},
            {"LC_ALL", reader.locale},
            {"TZ", reader.zone},
            {"COLUMNS", reader.columns},
            {"LD_PRELOAD", KVR_PROGRAMS "/libkvr-injector.so"},
            {"KVR_CLOCK", "1795608000"}};  // 2026-11-25, 12:00 UTC
  }
  ChildProcess startFor(const Reader& reader, const std::string& command) {
    return start(wordsOf(command), environmentFor(reader));
  }
  /// What the command prints, below a line that says for whom.
  std::string transcript(const Reader& reader, const std::string& command) {
    auto program = startFor(reader, command);
    auto [status, output, errors] = outcomeOf(program);
    EXPECT_EQ(errors, "") << command;
    // A line for each record, so that a difference shows which one it is in.
    for (std::size_t at = 0; (at = output.find("},{", at)) != std::string::npos;) output.insert(at + 2, "\n");
    return "$ LC_ALL=" + reader.locale + " TZ=" + reader.zone + " COLUMNS=" + reader.columns + " kvrctl " +
           command + "\n" + output + "[" + std::to_string(status) + "]\n\n";
  }
  void expectGolden(const std::string& name, const std::string& text) const {
    const fs::path golden = fs::path(KVR_GOLDENS) / name;
    if (std::getenv("KVR_RENEW_GOLDENS") != nullptr) {
      writeFile(golden, text);
      GTEST_SKIP() << golden << " has been renewed";
    }
    ChildProcess diff({"diff", "-u", golden, home.write("actual/" + name, text)});
    EXPECT_EQ(diff.wait(), 0) << diff.output() << diff.errorOutput();
  }

 private:
  std::shared_ptr<void> serving_;
};

TEST_F(TheOutput, IsTheSameTextForTheSameReader) {
  const std::vector<Reader> english{kBriton, {"en_GB.UTF-8", kBerlin, "40"}};
  std::vector<Reader> everybody{{"de_DE.UTF-8", kBerlin, "80"},
                                {"de_DE.UTF-8", "UTC", "40"},
                                {"ja_JP.UTF-8", "UTC", "80"},
                                {"ja_JP.UTF-8", kBerlin, "40"}};
  everybody.insert(everybody.begin(), english.begin(), english.end());
  const Reader program{"C", "UTC", ""};
  for (const std::string command :
       {"status", "info --all", "activities", "follow-ups", "timeline", "doctor"}) {
    std::string text;
    for (const auto& reader : command == "doctor" ? english : everybody) text += transcript(reader, command);
    expectGolden(wordsOf(command).front() + ".txt",
                 text + transcript(program, command) + transcript(program, command + " --json"));
  }
}

TEST_F(TheOutput, IsTheSamePictureForTheSameReader) {
  const std::tuple<const char*, Reader, const char*> pictures[] = {
      {"timeline.en.svg", kBriton, "timeline --svg -"},
      {"timeline.ja.svg", {"ja_JP.UTF-8", kBerlin, ""}, "timeline --svg -"},
      {"device.svg", kBriton, "timeline --svg - …0001"}};
  for (const auto& [name, reader, command] : pictures) {
    auto program = startFor(reader, command);
    EXPECT_EQ(program.wait(), 0) << program.errorOutput();
    expectGolden(name, program.output());
  }
}

TEST_F(TheOutput, IsColouredOnATerminalThatShowsColours) {
  std::string text;
  for (const std::string setting : {"TERM=xterm", "TERM=xterm NO_COLOR=1", "TERM=dumb"}) {
    for (const std::string command : {"status", "timeline", "doctor"}) {
      const std::string line = setting + " COLUMNS=80 " + kProgram + " " + command;
      ChildProcess terminal({"script", "-qe", "-E", "never", "-c", line, "/dev/null"},
                            environmentFor(kBriton));
      terminal.wait();
      text += "$ " + setting + " kvrctl " + command + "\n" + terminal.output() + "\n";
    }
  }
  for (auto at = text.find('\033'); at != std::string::npos; at = text.find('\033'))
    text.replace(at, 1, "<ESC>");
  std::erase(text, '\r');
  expectGolden("terminal.txt", text);
}

TEST_F(TheOutput, TellsEachChangeOnceWhileItIsWatched) {
  auto monitor = startFor({"en_GB.UTF-8", kBerlin, ""}, "monitor");
  monitor.waitForOutput("watching");
  run({"notify", "com.example.news"});
  monitor.waitForOutput("news");
  const auto change = [&](const char* file, const std::string& from, const std::string& to) {
    const fs::path path = fs::path("home/Library") / file;
    std::string content = *contentOfFile(path);
    content.replace(content.find(from), from.size(), to);
    fs::rename(home.write("new", content), path);
  };
  change("FollowUps/com.tarsil.Kavrel.plist", "13 days", "12 days");
  monitor.waitForOutput("12 days");
  change("Activities/com.tarsil.kvragent.plist", "2026-11-26T08", "2026-11-27T08");
  monitor.waitForOutput("27");
  change("Preferences/com.tarsil.kvragent.plist", "2026-11-25T08:59", "2026-11-25T12:00");
  monitor.waitForOutput("download");
  fs::remove("home/Library/FollowUps/com.tarsil.Kavrel.plist");
  monitor.waitForOutput("0001 gone");
  EXPECT_EQ(monitor.terminate(), 0);
  expectGolden("monitor.txt", monitor.output());
}

}  // namespace
}  // namespace kvr::testing
