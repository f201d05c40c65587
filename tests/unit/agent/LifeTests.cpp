#include "agent/StartUp.h"
#include "platform/simulated/SimulatedPlatform.h"
#include "scheduling/KVROutreachActivity.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kvr {
namespace {

constexpr double kDay = 86400;

/// A device from its first start on: its files and its clock outlive the processes.
class Life {
 public:
  /// `pause`: for so many days the device is off before.
  void start(const std::string& systemVersion, double pause = 0) {
    auto next = std::make_unique<SimulatedPlatform>();
    if (platform_) {
      next->files.takeOver(platform_->files);
      next->clock.set(platform_->clock.now() + pause * kDay);
      end();
    }
    platform_ = std::move(next);
    platform_->deviceProperties.answers = {{"SerialNumber", "PHONE"}, {"ProductVersion", systemVersion}};
    platform_->activities.boot = systemVersion;
    startUp_ = std::make_unique<StartUp>(platform_->platform);
  }
  void end() {
    EXPECT_THAT(platform_->faults(), ::testing::IsEmpty());
    platform_->activities.beginEnding();
    platform_->queues.beginEnding();
    startUp_.reset();
    platform_.reset();
  }
  ~Life() { end(); }

  SimulatedPlatform& platform() { return *platform_; }

 private:
  std::unique_ptr<SimulatedPlatform> platform_;
  std::unique_ptr<StartUp> startUp_;
};

// What whole lives show is kvr-simulate's to look at.
TEST(ABoot, RunsWhatIsOverdueOnce) {
  Life life;
  life.start("17.9");
  life.platform().queues.advance(0.1 * kDay);
  KVRScheduler::newSchedulerWithActivityDelegate(
      life.platform().platform, std::make_shared<KVROutreachActivity>(life.platform().platform))
      ->scheduleActivityForDate(life.platform().clock.now() + 0.05 * kDay);
  life.start("17.10", 0.1);  // and another boot
  life.platform().queues.advance(0.01 * kDay);
  const auto& log = life.platform().log;
  EXPECT_EQ(log.count("'com.tarsil.kvragent.outreach' not complete, rescheduling"), 1U);
  EXPECT_EQ(log.count("target reached for 'com.tarsil.kvragent.outreach', trigger activity"), 1U);
}

}  // namespace
}  // namespace kvr
