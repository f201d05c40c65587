#include "simulated/SimulatedActivityScheduler.h"

#include <utility>

namespace kvr {
namespace {

/// The most that rounding a date may shorten a wait by, in seconds.
constexpr double kMargin = 0.001;

}  // namespace

SimulatedActivityScheduler::SimulatedActivityScheduler(PropertyListFiles& lists, SimulatedClock& clock,
                                                       SimulatedWorkQueues& queues, Random& random,
                                                       const DeviceProperties& device, Log& log,
                                                       const std::string& mainBundleIdentifier,
                                                       ActivityOccasions occasions)
    : FileActivityScheduler(lists, clock, queues, random, device, log, mainBundleIdentifier,
                            std::move(occasions)),
      clock_(clock),
      queues_(queues) {
  clock_.whenMoved([this] { startDue(); });
}

SimulatedActivityScheduler::~SimulatedActivityScheduler() { clock_.whenMoved(nullptr); }

/// An earlier event that is already scheduled is kept; it arms again for the rest of the wait.
void SimulatedActivityScheduler::arm(std::optional<double> wait) {
  if (!wait) return;
  const double time = clock_.elapsed() + *wait + kMargin;
  if (armed_ && *armed_ <= time) return;
  armed_ = time;
  queues_.after(time - clock_.elapsed(), queues_.concurrentQueue(Priority::Default),
                [this, alive = life(), time] {
                  if (alive.expired()) return;
                  if (armed_ == time) armed_.reset();
                  startDue();
                });
}

}  // namespace kvr
