#pragma once

#include "Prelude.h"
#include "simulated/SimulatedPlatform.h"

namespace kvr {

/// A test in a simulated world of its own. What can still run without time passing runs at the end; a fault
/// fails the test. A test that provokes faults takes them (`takeFaults`).
template <class World>
struct TestIn : ::testing::Test {
  void TearDown() override {
    world.queues.run();
    EXPECT_THAT(world.faults(), IsEmpty());
  }

  World world;
};

using SimulatedTest = TestIn<SimulatedPlatform>;

}  // namespace kvr
