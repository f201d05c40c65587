#include "Prelude.h"
#include "platform/log/Completion.h"
#include "platform/log/Format.h"
#include "platform/log/Log.h"

namespace kvr {
namespace {

struct Described {
  std::string description() const { return "described"; }
};

TEST(AMessage, IsFilledInItsOwnOrder) {
  const char* const absent = nullptr;
  EXPECT_EQ(format("%s: %d, %ld and %lu", "name", -1, std::int64_t{-5'000'000'000}, ~0ULL),
            "name: -1, -5000000000 and 18446744073709551615");
  EXPECT_EQ(format("%d%d", true, std::uint8_t{200}), "1200");
  EXPECT_EQ(format("%f|%.02f|%.0f|%@", 0.5, 1.005, 2.5, 1e300), "0.500000|1.00|2|" + format("%f", 1e300));
  EXPECT_EQ(format("%@ %@ %s", std::string("text with %@ and %s"), absent, absent),
            "text with %@ and %s (null) (null)");
  EXPECT_EQ(format("%@, %@, %@", Described(), std::make_shared<Described>(), std::shared_ptr<Described>()),
            "described, described, (null)");
  EXPECT_EQ(format("%@ %@", std::optional<std::string>("there"), std::optional<Date>()), "there (null)");
  EXPECT_EQ(format("%@%@", std::vector<std::string>{"a", "b"}, std::vector<Described>{}), "(a, b)()");
  EXPECT_EQ(format("%@", Error{"files", 2, "missing"}), "Error Domain=files Code=2 \"missing\"");
}

struct KeptLines : Log {
  KeptLines() : Log(LogLevel::Error, false) {}
  void write(LogLevel, const std::string& message) override { lines.push_back(message); }
  std::vector<std::string> lines;
};

TEST(ACompletion, AnswersOnceReleasesWhatItHoldsAndReportsOneAnswerTooManyOrTooFew) {
  KeptLines log;
  int answers = 0;
  const auto held = std::make_shared<int>();
  {
    const Completion<> twice(log, "twice", [&answers, held] { ++answers; });
    twice();
    EXPECT_EQ(held.use_count(), 1);
    twice();
    const Completion<> never(log, "never", [] {});
  }
  EXPECT_EQ(answers, 1);
  EXPECT_THAT(log.lines,
              ElementsAre("twice: answered a second time, refused", "never: went without an answer"));
}

}  // namespace
}  // namespace kvr
