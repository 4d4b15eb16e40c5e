#include "nn/engine.h"

#include <gtest/gtest.h>

#include <cstdlib>

namespace nn {
namespace {

TEST(EngineTest, SeedFollowsTheProcessAndClockFormula) {
  EXPECT_EQ(Engine::SeedFor(100, 1000), 66237);
  // A process number below 83 makes the product negative: the absolute value.
  EXPECT_EQ(Engine::SeedFor(1, 1700000000), 59509);
  // The product wraps around in 64 bits before the remainder.
  EXPECT_EQ(Engine::SeedFor(4194304, int64_t{1} << 50), 81968);
}

TEST(EngineDeathTest, StartsInCpuModeAndTrainingPhase) {
  // A fresh process, so that no other test has set the singleton before.
  EXPECT_EXIT(
      {
        const bool fresh = Engine::mode() == Engine::CPU && Engine::phase() == Engine::TRAIN;
        Engine::set_phase(Engine::TEST);
        std::exit(fresh && Engine::phase() == Engine::TEST ? 0 : 1);
      },
      testing::ExitedWithCode(0), "");
}

}  // namespace
}  // namespace nn
