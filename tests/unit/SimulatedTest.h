#pragma once

#include "platform/simulated/SimulatedPlatform.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kvr {

/// A test on a simulated platform of its own. What can still run without time passing runs at the end; a
/// fault fails the test. A test that provokes faults takes them (`takeFaults`).
class SimulatedTest : public ::testing::Test {
 protected:
  void TearDown() override {
    simulated.queues.run();
    EXPECT_THAT(simulated.faults(), ::testing::IsEmpty());
  }

  SimulatedPlatform simulated;
};

}  // namespace kvr
