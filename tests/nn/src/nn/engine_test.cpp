#include "nn/engine.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdlib>
#include <memory>
#include <string>

#include "gradient_checker.h"
#include "nn/filler.h"

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
  EXPECT_EXIT(std::exit(Engine::mode() == Engine::CPU && Engine::phase() == Engine::TRAIN ? 0 : 1),
              testing::ExitedWithCode(0), "");
}

void Fill(const std::string& text, Blob<float>* blob) {
  std::unique_ptr<Filler<float>>(GetFiller<float>(Parse<FillerParameter>(text)))->Fill(blob);
}

TEST(FillerTest, EachTypeFillsWithinItsLaw) {
  Blob<float> blob(2, 3, 4, 5);
  Fill("value: 2.5", &blob);
  for (int i = 0; i < blob.count(); ++i) {
    ASSERT_EQ(blob.cpu_data()[i], 2.5f);
  }
  Fill("type: 'uniform' min: -3 max: -2", &blob);
  for (int i = 0; i < blob.count(); ++i) {
    ASSERT_TRUE(blob.cpu_data()[i] >= -3.0f && blob.cpu_data()[i] <= -2.0f);
  }
  Fill("type: 'positive_unitball'", &blob);
  for (int n = 0; n < 2; ++n) {
    float sum = 0;
    for (int j = 0; j < 60; ++j) {
      ASSERT_GT(blob.cpu_data()[n * 60 + j], 0.0f);
      sum += blob.cpu_data()[n * 60 + j];
    }
    EXPECT_NEAR(sum, 1.0f, 1e-5);
  }
  // Xavier bounds: sqrt(3 / fan_in), fan_in = 60 per num, and 1 for a column.
  Fill("type: 'xavier'", &blob);
  for (int i = 0; i < blob.count(); ++i) {
    ASSERT_LE(std::fabs(blob.cpu_data()[i]), std::sqrt(3.0f / 60.0f));
  }
  Blob<float> column(6, 1, 1, 1);
  Fill("type: 'xavier'", &column);
  for (int i = 0; i < 6; ++i) {
    ASSERT_LE(std::fabs(column.cpu_data()[i]), std::sqrt(3.0f));
  }
  // The default sparsity -1 means no mask and no shape demand.
  Fill("type: 'gaussian' mean: 10 std: 0.1", &blob);
  EXPECT_NEAR(blob.cpu_data()[0], 10.0f, 1.0f);

  // Sparse Gaussian masks a matrix: sparse / height is the chance of a weight.
  Blob<float> matrix(1, 1, 50, 8);
  Fill("type: 'gaussian' sparse: 0", &matrix);
  for (int i = 0; i < matrix.count(); ++i) {
    ASSERT_EQ(matrix.cpu_data()[i], 0.0f);
  }
  Fill("type: 'gaussian' mean: 5 sparse: 50", &matrix);
  for (int i = 0; i < matrix.count(); ++i) {
    ASSERT_NE(matrix.cpu_data()[i], 0.0f);
  }
}

TEST(FillerDeathTest, BadParametersEndTheProcessWithTheirWords) {
  Blob<float> blob(2, 1, 2, 2);
  EXPECT_DEATH(Fill("type: 'Gaussian'", &blob), "Check failed: false Unknown filler name: Gaussian");
  EXPECT_DEATH(Fill("sparse: 3", &blob),
               "this->filler_param_.sparse\\(\\) == -1 .*Sparsity not supported by this Filler.");
  EXPECT_DEATH(Fill("type: 'xavier' sparse: 3", &blob), "Sparsity not supported by this Filler.");
  EXPECT_DEATH(Fill("type: 'gaussian' sparse: -2", &blob), "Check failed: sparse >= -1 ");
  EXPECT_DEATH(Fill("type: 'gaussian' sparse: 1", &blob), "Check failed: blob->num\\(\\) == 1 ");
  // An empty blob: the data pointer is asked first by some, the count by others.
  Blob<float> empty(0, 1, 1, 1);
  EXPECT_DEATH(Fill("", &empty), "Check failed: data_ ");
  EXPECT_DEATH(Fill("type: 'uniform'", &empty), "Check failed: blob->count\\(\\) ");
  EXPECT_DEATH(Fill("type: 'xavier'", &empty), "Check failed: blob->count\\(\\) ");
}

}  // namespace
}  // namespace nn
