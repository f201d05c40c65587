#include "platform/simulated/SimulatedWorkQueues.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <set>
#include <stdexcept>

// What any work queues do is tested on these as well, by the suite that the local ones share.

namespace kvr {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class SimulatedQueues : public ::testing::Test {
 protected:
  static std::vector<std::string> orderFor(std::uint64_t seed) {
    SimulatedClock clock;
    SimulatedWorkQueues queues(clock, seed);
    std::vector<std::string> record;
    for (const std::string name : {"a", "b", "c"}) {
      const auto queue = queues.newSerialQueue(name);
      for (const std::string item : {"1", "2", "3"})
        queue->async([&, entry = name + item] { record.push_back(entry); });
      queues.concurrentQueue(Priority::Default)->async([&, name] { record.push_back(name); });
    }
    queues.run();
    return record;
  }

  SimulatedClock clock{Date{1000}};
  SimulatedWorkQueues queues{clock, 1};
  WorkQueueRef concurrent = queues.concurrentQueue(Priority::Default);
  std::vector<std::string> record;
};

TEST_F(SimulatedQueues, RunInAnOrderThatTheSeedDecides) {
  std::set<std::vector<std::string>> orders;
  for (std::uint64_t seed = 0; seed < 20; ++seed) {
    EXPECT_EQ(orderFor(seed), orderFor(seed));
    orders.insert(orderFor(seed));
  }
  EXPECT_EQ(orders.size(), 20U);
}

TEST_F(SimulatedQueues, LetTimePassOnlyWhenAskedTo) {
  constexpr double kYear = 366 * 86400.0;
  queues.after(kYear, concurrent, [&] { record.emplace_back("a year later"); });
  concurrent->async([&] { record.emplace_back(queues.newSignal()->wait(60) ? "signalled" : "over"); });
  queues.run();
  EXPECT_EQ(clock.elapsed(), 0);
  EXPECT_EQ(queues.waiting(), 1U);
  queues.advance(59);
  EXPECT_THAT(record, IsEmpty());
  clock.set(Date{5});
  queues.advance(1);
  EXPECT_THAT(record, ElementsAre("over"));
  EXPECT_EQ(clock.now(), Date{6});
  EXPECT_TRUE(queues.runUntil([&] { return record.size() == 2; }));
  EXPECT_EQ(clock.elapsed(), kYear);
  EXPECT_FALSE(queues.hasFuture());
}

TEST_F(SimulatedQueues, AWaitIsNotHeldUpByTheWaitsOfOthers) {
  for (const double limit : {30.0, 10.0, 20.0}) {
    concurrent->async([&, limit] {
      queues.newSignal()->wait(limit);
      record.push_back(std::to_string(static_cast<int>(clock.elapsed())));
    });
  }
  queues.advance(60);
  EXPECT_THAT(record, ElementsAre("10", "20", "30"));
}

TEST_F(SimulatedQueues, TellOfWaitsThatNothingCanEnd) {
  const auto never = queues.newSignal();
  EXPECT_THROW(never->wait(std::nullopt), std::logic_error);
  concurrent->async([&] { never->wait(std::nullopt); });
  EXPECT_FALSE(queues.runUntil([] { return false; }));
  queues.mainQueue()->async([&] { never->wait(1); });
  queues.run();
  EXPECT_THAT(queues.takeFaults(), ElementsAre("work item failed: deadlock: nothing can end this wait",
                                               "work item failed: an item waits on the main queue"));
}

TEST_F(SimulatedQueues, TellOfWorkWithoutEnd) {
  Work again;
  again = [&] { concurrent->async(again); };
  concurrent->async(again);
  EXPECT_THROW(queues.run(), std::logic_error);
}

}  // namespace
}  // namespace kvr
