#include "Prelude.h"
#include "local/loop/EventLoop.h"
#include "local/loop/LocalWorkQueues.h"
#include "simulated/SimulatedLog.h"
#include "simulated/loop/SimulatedWorkQueues.h"

#include <atomic>
#include <future>
#include <latch>
#include <stdexcept>
#include <thread>

namespace kvr {
namespace {

constexpr int kMany = 200;

/// Work queues of either kind. While the test's thread waits for a signal, work goes on: local queues have
/// their own threads, simulated ones run inside the wait.
struct QueuesWorld {
  virtual ~QueuesWorld() = default;
  virtual WorkQueues& queues() = 0;
  virtual void beginEnding() = 0;
  /// The log lines about work items that failed.
  virtual std::vector<std::string> failures() const = 0;
};

/// The main event loop runs on its own thread, so that the test's thread may wait.
struct LocalQueuesWorld : QueuesWorld {
  LocalQueuesWorld() {
    std::promise<void> ready;
    thread_ = std::thread([this, &ready] {
      EventLoop loop;
      LocalWorkQueues queues(loop, log_);
      loop_ = &loop;
      queues_ = &queues;
      ready.set_value();
      loop.run();
    });
    ready.get_future().wait();
  }
  ~LocalQueuesWorld() override {
    loop_->exit(0);
    thread_.join();
  }

  LocalWorkQueues& queues() override { return *queues_; }
  void beginEnding() override { queues_->beginEnding(); }
  std::vector<std::string> failures() const override { return log_.texts(LogLevel::Error); }

 private:
  SimulatedLog log_;
  EventLoop* loop_ = nullptr;
  LocalWorkQueues* queues_ = nullptr;
  std::thread thread_;
};

struct SimulatedQueuesWorld : QueuesWorld {
  WorkQueues& queues() override { return queues_; }
  void beginEnding() override { queues_.beginEnding(); }
  std::vector<std::string> failures() const override { return queues_.faults(); }

 private:
  SimulatedClock clock_;
  SimulatedWorkQueues queues_{clock_, 1};
};

struct WorkQueuesTest : ::testing::TestWithParam<bool> {
  WorkQueues& queues() { return world->queues(); }
  std::shared_ptr<Signal> newSignal() { return queues().newSignal(); }
  WorkQueueRef serial() { return queues().newSerialQueue("test"); }
  WorkQueueRef concurrent() { return queues().concurrentQueue(Priority::Default); }
  static void await(const std::shared_ptr<Signal>& signal) { ASSERT_TRUE(signal->wait(std::nullopt)); }
  /// Waits until everything handed to `queue` so far has run.
  void flush(const WorkQueueRef& queue) {
    const auto done = newSignal();
    queue->async([done] { done->signal(); });
    await(done);
  }

  std::vector<std::string> record;  ///< what happened on one serial queue
  std::unique_ptr<QueuesWorld> world =
      GetParam() ? std::unique_ptr<QueuesWorld>(std::make_unique<LocalQueuesWorld>())
                 : std::make_unique<SimulatedQueuesWorld>();
};

INSTANTIATE_TEST_SUITE_P(Both, WorkQueuesTest, ::testing::Values(true, false),
                         [](const auto& tested) { return tested.param ? "Local" : "Simulated"; });

TEST_P(WorkQueuesTest, MainAndSerialQueuesRunOneItemAtATimeInTheOrderHandedOver) {
  for (const auto& queue : {queues().mainQueue(), serial()}) {
    std::vector<int> order;
    std::vector<int> expected;
    std::atomic<int> running{0};
    std::atomic<int> most{0};
    for (int i = 0; i < kMany; ++i) {
      expected.push_back(i);
      queue->async([&, i] {
        most = std::max<int>(most, ++running);
        order.push_back(i);
        --running;
      });
    }
    flush(queue);
    EXPECT_EQ(order, expected);
    EXPECT_EQ(most, 1);
  }
}

TEST_P(WorkQueuesTest, OthersGoOnHoweverManyItemsWait) {
  const auto gate = newSignal();
  const auto allThrough = newSignal();
  std::atomic<int> arrived{0};
  std::atomic<int> through{0};
  std::vector<WorkQueueRef> serialQueues;
  const auto waitAtGate = [&] {
    // The last one to arrive opens the gate, so all of them must run at the same time.
    if (++arrived == 3 * kMany) gate->signal();
    if (gate->wait(std::nullopt) && ++through == 3 * kMany) allThrough->signal();
  };
  for (int i = 0; i < kMany; ++i) {
    concurrent()->async(waitAtGate);
    queues().concurrentQueue(Priority::Background)->async(waitAtGate);
    serialQueues.push_back(serial());
    serialQueues.back()->async(waitAtGate);
  }
  await(allThrough);
  EXPECT_THAT(world->failures(), IsEmpty());
}

TEST_P(WorkQueuesTest, ASerialQueueStaysBusyWhileItsItemWaits) {
  const auto gate = newSignal();
  const auto queue = serial();
  queue->async([&] {
    record.emplace_back("begins");
    gate->wait(std::nullopt);
    record.emplace_back("ends");
  });
  queue->async([&] { record.emplace_back("next"); });
  flush(serial());
  queues().after(0.01, concurrent(), [&] { gate->signal(); });
  flush(queue);
  EXPECT_THAT(record, ElementsAre("begins", "ends", "next"));
}

TEST_P(WorkQueuesTest, DelayedWorkIsHandedOverInTheOrderOfItsDates) {
  const auto queue = serial();
  const auto done = newSignal();
  queues().after(0.03, queue, [&] { done->signal(); });
  queues().after(0.02, queue, [&] { record.emplace_back("later"); });
  queues().after(0.01, queue, [&] { record.emplace_back("sooner"); });
  queues().after(std::nan(""), queue, [&] { record.emplace_back("undefined"); });
  queues().after(-1, queue, [&] { record.emplace_back("negative"); });
  queues().after(INFINITY, queue, [&] { record.emplace_back("never"); });
  queues().after(1e300, queue, [&] { record.emplace_back("never"); });
  await(done);
  EXPECT_THAT(record, ElementsAre("undefined", "negative", "sooner", "later"));
}

TEST_P(WorkQueuesTest, AGroupGivesNoticeWhenItIsEmptyAndCanBeUsedAgain) {
  const auto queue = serial();
  WorkGroup group;
  std::atomic<int> worked{0};
  std::vector<int> workedAtNotice;
  for (const int items : {0, kMany, kMany}) {
    const auto noticed = newSignal();
    for (int i = 0; i < items; ++i) group.enter();
    group.notify(queue, [&, noticed] {
      workedAtNotice.push_back(worked);
      noticed->signal();
    });
    if (items == 0) {
      flush(queue);
      EXPECT_THAT(workedAtNotice, SizeIs(1)) << "an empty group gives notice at once";
    }
    for (int i = 0; i < items; ++i) {
      concurrent()->async([&] {
        ++worked;
        group.leave();
      });
    }
    await(noticed);
  }
  EXPECT_THAT(workedAtNotice, ElementsAre(0, kMany, 2 * kMany));
}

TEST_P(WorkQueuesTest, ASignalStaysAndAWaitEndsAtItsLimit) {
  const auto never = newSignal();
  const auto signalled = newSignal();
  signalled->signal();
  signalled->signal();
  const auto done = newSignal();
  concurrent()->async([&] {
    for (const double limit : {0.01, 0.0, -1.0, std::nan("")}) EXPECT_FALSE(never->wait(limit)) << limit;
    for (const auto limit : {std::optional(0.0), std::optional<double>(), std::optional<double>(INFINITY)}) {
      EXPECT_TRUE(signalled->wait(limit));
    }
    done->signal();
  });
  await(done);
  EXPECT_FALSE(never->wait(0.01)) << "outside of all queues";
}

TEST_P(WorkQueuesTest, ATimerRepeatsUntilItIsInvalidated) {
  const auto queue = serial();
  const auto marker = std::make_shared<int>(0);
  const std::weak_ptr<int> released = marker;
  std::atomic<int> firings{0};
  const auto thrice = newSignal();
  std::shared_ptr<Timer> timer;
  queue->async([&, held = marker] {
    timer = queues().newRepeatingTimer(0.001, queue, [&, held] {
      if (++firings < 3) return;
      timer->invalidate();
      thrice->signal();
    });
  });
  await(thrice);
  const auto later = newSignal();
  queues().after(0.01, queue, [&] { later->signal(); });
  await(later);
  EXPECT_EQ(firings, 3);
  EXPECT_EQ(released.use_count(), 1) << "an invalidated timer still holds its work";
}

TEST_P(WorkQueuesTest, ATimerDoesNotFloodAQueueThatIsBehind) {
  const auto queue = serial();
  std::atomic<int> firings{0};
  const auto gate = newSignal();
  queue->async([&] { gate->wait(std::nullopt); });
  const auto timer = queues().newRepeatingTimer(0.001, queue, [&] { ++firings; });
  queues().after(0.02, concurrent(), [&] {
    timer->invalidate();
    gate->signal();
  });
  await(gate);
  flush(queue);
  EXPECT_EQ(firings, 1);
}

TEST_P(WorkQueuesTest, WorkIsReleasedRightAfterItRan) {
  for (const auto& queue : {queues().mainQueue(), serial()}) {
    auto marker = std::make_shared<int>(0);
    const std::weak_ptr<int> watched = marker;
    std::atomic<bool> wasReleased{false};
    queue->async([held = std::move(marker)] { ASSERT_EQ(held.use_count(), 1); });
    queue->async([&] { wasReleased = watched.expired(); });
    flush(queue);
    EXPECT_TRUE(wasReleased);
  }
}

TEST_P(WorkQueuesTest, AnExceptionEndsItsItemOnlyAndIsReported) {
  for (const auto& queue : {queues().mainQueue(), serial()}) {
    const auto before = world->failures().size();
    queue->async([] { throw std::runtime_error("boom"); });
    queue->async([] { throw 1; });
    flush(queue);
    EXPECT_EQ(world->failures().size(), before + 2);
  }
  EXPECT_THAT(world->failures(), Contains("work item failed: boom").Times(2));
}

TEST_P(WorkQueuesTest, WorkThatNeverRanIsReleasedAtTheEnd) {
  auto marker = std::make_shared<int>(0);
  const auto queue = serial();
  queues().after(1e6, queue, [held = marker] {});
  queues().after(INFINITY, queues().mainQueue(), [held = marker] {});
  const auto timer = queues().newRepeatingTimer(1e6, queue, [held = marker] {});
  // This wait ends when the queues are destroyed. Work queued behind it, or handed over after it, must not
  // run.
  const auto begun = newSignal();
  std::atomic<int> late{0};
  queue->async([&late, begun, never = newSignal(), queue, held = marker] {
    begun->signal();
    never->wait(std::nullopt);
    queue->async([&late, held] { ++late; });
  });
  for (int i = 0; i < kMany; ++i) queue->async([&late, held = marker] { ++late; });
  await(begun);
  timer->invalidate();
  world.reset();
  EXPECT_EQ(late, 0);
  EXPECT_EQ(marker.use_count(), 1);
}

TEST_P(WorkQueuesTest, EndingEndsEveryWait) {
  const auto never = newSignal();
  std::atomic<int> begun{0};
  std::atomic<int> ended{0};
  const auto allBegun = newSignal();
  for (int i = 0; i < kMany; ++i) {
    concurrent()->async([&, limit = i % 2 == 0 ? std::optional(1e6) : std::nullopt] {
      if (++begun == kMany) allBegun->signal();
      if (!never->wait(limit)) ++ended;
    });
  }
  await(allBegun);
  world->beginEnding();
  EXPECT_FALSE(never->wait(std::nullopt));
  world.reset();
  EXPECT_EQ(ended, kMany);
}

TEST_P(WorkQueuesTest, OneOperationAtATimeHasItsTurnAndAFailureEndsIt) {
  const auto turns = queues().newTurns("test");
  const auto othersMayRun = serial();
  const auto done = newSignal();
  std::atomic<int> running{0};
  std::atomic<int> most{0};
  std::atomic<int> through{0};
  for (int i = 0; i < kMany; ++i) {
    concurrent()->async([&, i] {
      const Turn turn(*turns);
      const Turn again(*turns);
      most = std::max<int>(most, ++running);
      othersMayRun->async([] {});
      --running;
      if (++through == kMany) done->signal();
      if (i % 2 == 0) throw std::runtime_error("boom");
    });
  }
  await(done);
  EXPECT_EQ(most, 1);

  const auto begun = newSignal();
  concurrent()->async([&] {
    const Turn turn(*turns);
    begun->signal();
    newSignal()->wait(0.01);
    record.emplace_back("inside");
  });
  await(begun);
  const Turn turn(*turns);
  record.emplace_back("outside of all queues");
  EXPECT_THAT(record, ElementsAre("inside", "outside of all queues"));
}

// Only for virtual time.

TEST(SimulatedQueues, SayWhoWaitsForWhomWhenTwoTakeTwoTurnsInOppositeOrder) {
  SimulatedClock clock;
  SimulatedWorkQueues queues(clock, 1);
  const auto fork = queues.newTurns("fork");
  const auto knife = queues.newTurns("knife");
  const auto bothHaveOne = queues.newSignal();
  int having = 0;
  const auto take = [&](Turns& first, Turns& second) {
    const Turn turn(first);
    if (++having == 2) bothHaveOne->signal();
    bothHaveOne->wait(std::nullopt);
    const Turn other(second);
  };
  queues.newSerialQueue("Ada")->async([&] { take(*fork, *knife); });
  queues.newSerialQueue("Ben")->async([&] { take(*knife, *fork); });
  queues.run();
  EXPECT_THAT(queues.faults(),
              ElementsAre(AllOf(HasSubstr("the queue 'Ada' waits for the turn 'knife' of item"),
                                HasSubstr("the queue 'Ben' waits for the turn 'fork' of item"))));
}

// Only for real threads.

TEST(LocalQueues, DrainOnceNothingIsQueuedOrRunningAndTakeNothingMore) {
  LocalQueuesWorld world;
  auto& queues = world.queues();
  const auto gate = queues.newSignal();
  const auto queue = queues.newSerialQueue("test");
  std::atomic<bool> last{false};
  queue->async([&] { gate->wait(std::nullopt); });
  queue->async([&] { last = true; });
  queues.after(1e6, queue, [] {});
  EXPECT_EQ(queues.outstanding(), 2U);
  EXPECT_FALSE(queues.drain(0));
  gate->signal();
  EXPECT_TRUE(queues.drain(INFINITY));
  EXPECT_TRUE(last);
  EXPECT_EQ(queues.outstanding(), 0U);

  const auto marker = std::make_shared<int>(0);
  queue->async([held = marker] { FAIL() << "ran after the end"; });
  EXPECT_EQ(marker.use_count(), 1);
}

TEST(LocalQueues, LetTheBackgroundNeitherStarveNorHoldUpTheRest) {
  LocalQueuesWorld world;
  const auto work = world.queues().concurrentQueue(Priority::Default);
  const auto background = world.queues().concurrentQueue(Priority::Background);
  const auto threads = static_cast<int>(std::max(4U, std::thread::hardware_concurrency()));
  const auto turn = world.queues().newSignal();
  std::atomic<bool> isOver{false};
  // Every item hands over the next one, so there is always more to do than there are threads.
  const std::function<void()> another = [&] {
    if (!isOver) work->async(another);
  };
  for (int i = 0; i < 4 * threads; ++i) work->async(another);
  background->async([&] { turn->signal(); });
  EXPECT_TRUE(turn->wait(60)) << "the background never had its turn";
  isOver = true;

  // All threads are busy while the items are handed over. Those in the background then keep a thread each.
  std::latch allBusy(threads + 1);
  std::promise<void> open, done, over;
  const auto gate = open.get_future().share(), end = over.get_future().share();
  for (int i = 0; i < threads; ++i) {
    work->async([&] {
      allBusy.count_down();
      gate.wait();
    });
  }
  allBusy.arrive_and_wait();
  for (int i = 0; i < kMany; ++i) background->async([end] { end.wait(); });
  work->async([&] { done.set_value(); });
  open.set_value();
  EXPECT_EQ(done.get_future().wait_for(std::chrono::seconds(30)), std::future_status::ready);
  over.set_value();
  EXPECT_TRUE(world.queues().drain(INFINITY));
}

TEST(AnEventLoop, RunsWhatWasPostedBeforeTheExitAndReleasesTheRest) {
  EventLoop loop;
  std::vector<std::string> ran;
  const auto marker = std::make_shared<int>(0);
  const auto cancelled = loop.after(1e6, [held = marker] {});
  EXPECT_EQ(marker.use_count(), 2);
  loop.cancel(cancelled);
  EXPECT_EQ(marker.use_count(), 1);
  loop.setFailureHandler([&](const std::string& what) { ran.push_back(what); });
  loop.after(0, [&] {
    ran.emplace_back("timer");
    loop.post([&] {
      ran.emplace_back("posted");
      throw std::runtime_error("boom");
    });
    loop.exit(7);
    loop.post([&, held = marker] { ran.emplace_back("posted after the exit"); });
    loop.after(1e6, [held = marker] {});
    loop.after(INFINITY, [held = marker] {});
  });
  EXPECT_EQ(loop.run(), 7);
  EXPECT_THAT(ran, ElementsAre("timer", "posted", "boom"));
  loop.post([held = marker] {});
  EXPECT_EQ(marker.use_count(), 1);
}

}  // namespace
}  // namespace kvr
