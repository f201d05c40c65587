#pragma once

#include "Prelude.h"
#include "simulated/SimulatedPlatform.h"

namespace kvr {

/// A test on its own simulated platform. At the end, everything runs that can run without time passing, and a
/// fault fails the test. A test that provokes faults must take them (`takeFaults`).
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
