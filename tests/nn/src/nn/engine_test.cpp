#include "nn/engine.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <memory>
#include <numeric>
#include <string>
#include <utility>

#include "gradient_checker.h"
#include "nn/filler.h"
#include "nn/util/math_functions.h"

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

// The lowest and the highest value of a blob filled as `text` says.
std::pair<float, float> FilledRange(const std::string& text, Blob<float>* blob) {
  Fill(text, blob);
  const auto range = std::minmax_element(blob->cpu_data(), blob->cpu_data() + blob->count());
  return {*range.first, *range.second};
}

TEST(FillerTest, EachTypeFillsWithinItsLaw) {
  using Range = std::pair<float, float>;
  Blob<float> blob(2, 3, 4, 5);
  EXPECT_EQ(FilledRange("value: 2.5", &blob), Range(2.5f, 2.5f));
  const Range uniform = FilledRange("type: 'uniform' min: -3 max: -2", &blob);
  EXPECT_TRUE(uniform.first >= -3 && uniform.second <= -2);
  // Xavier bounds: sqrt(3 / fan_in), fan_in = 60 per num, and 1 for a column.
  const Range xavier = FilledRange("type: 'xavier'", &blob);
  EXPECT_TRUE(xavier.first >= -std::sqrt(0.05f) && xavier.second <= std::sqrt(0.05f));
  Blob<float> column(6, 1, 1, 1);
  const Range wide = FilledRange("type: 'xavier'", &column);
  EXPECT_TRUE(wide.first >= -std::sqrt(3.0f) && wide.second <= std::sqrt(3.0f));
  // The default sparsity -1 means no mask and no shape demand.
  EXPECT_NEAR(FilledRange("type: 'gaussian' mean: 10 std: 0.1", &blob).first, 10.0f, 1.0f);
  EXPECT_GT(FilledRange("type: 'positive_unitball'", &blob).first, 0.0f);
  for (int n = 0; n < 2; ++n) {
    EXPECT_NEAR(std::accumulate(blob.cpu_data() + n * 60, blob.cpu_data() + n * 60 + 60, 0.0f),
                1.0f, 1e-5);
  }
  // Sparse Gaussian masks a matrix: sparse / height is the chance of a weight.
  Blob<float> matrix(1, 1, 50, 8);
  EXPECT_EQ(FilledRange("type: 'gaussian' sparse: 0", &matrix), Range(0, 0));
  Fill("type: 'gaussian' mean: 5 sparse: 50", &matrix);
  EXPECT_EQ(std::count(matrix.cpu_data(), matrix.cpu_data() + matrix.count(), 0.0f), 0);
}

TEST(FillerDeathTest, BadParametersEndTheProcessWithTheirWords) {
  Blob<float> blob(2, 1, 2, 2);
  EXPECT_DEATH(Fill("type: 'Gaussian'", &blob),
               "Check failed: false Unknown filler name: Gaussian");
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

TEST(MathFunctionsTest, SignAndIndexOfLargestMagnitude) {
  const std::vector<float> x = {-2.0f, 0.0f, 3.0f, std::numeric_limits<float>::quiet_NaN(), -0.0f};
  std::vector<float> sign(5);
  nn_cpu_sign(5, x.data(), sign.data());
  EXPECT_EQ(sign, (std::vector<float>{-1, 0, 1, 0, 0}));
  const std::vector<float> tie = {0.1f, -0.5f, 0.2f, 0.5f};
  EXPECT_EQ(cblas_isamax(4, tie.data(), 1), 1u) << "the lowest index wins a tie";
  EXPECT_EQ(cblas_isamax(0, tie.data(), 1), 0u);
}

TEST(MathFunctionsTest, DegenerateRandomDrawsStayInTheirRanges) {
  std::vector<float> r(1000);
  nn_rng_uniform(1000, 1.0f, 1.0f, r.data());
  for (float v : r) {
    ASSERT_TRUE(v == 1.0f || v == std::nextafter(1.0f, 2.0f)) << v;
  }
  std::vector<int> bits(500, 7);
  nn_rng_bernoulli(500, 1.0, bits.data());
  EXPECT_EQ(bits, std::vector<int>(500, 1));
  nn_rng_bernoulli(500, 0.0f, bits.data());
  EXPECT_EQ(bits, std::vector<int>(500, 0));
}

TEST(MathFunctionsDeathTest, RandomDrawsAndSignCheckTheirArguments) {
  std::vector<float> r(4);
  std::vector<int> bits(4);
  EXPECT_DEATH(nn_rng_uniform(-1, 0, 1, r.data()), "Check failed: n >= 0 ");
  EXPECT_DEATH(nn_rng_uniform(4, 0, 1, nullptr), "Check failed: r ");
  EXPECT_DEATH(nn_rng_uniform(4, 2, 1, r.data()), "Check failed: a <= b ");
  EXPECT_DEATH(nn_rng_gaussian(4, 0, 0, r.data()), "Check failed: sigma > 0 ");
  EXPECT_DEATH(nn_rng_gaussian(4, 0, std::nanf(""), r.data()), "Check failed: sigma > 0 ");
  EXPECT_DEATH(nn_rng_bernoulli(4, -0.5, bits.data()), "Check failed: p >= 0 ");
  EXPECT_DEATH(nn_rng_bernoulli(4, 1.5f, bits.data()), "Check failed: p <= 1 ");
  EXPECT_DEATH(nn_cpu_sign(0, r.data(), r.data()), "Check failed: n > 0 ");
  EXPECT_DEATH(nn_cpu_sign(4, nullptr, r.data()), "Check failed: x ");
}

}  // namespace
}  // namespace nn
