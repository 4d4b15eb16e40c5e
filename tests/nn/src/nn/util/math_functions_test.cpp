#include "nn/util/math_functions.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <vector>

namespace nn {
namespace {

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

TEST(MathFunctionsTest, Im2colUnfoldsWithZeroPaddingAndCol2imAddsBack) {
  // The 2x2 image 1, 2, 3, 4 under 2x2 windows, padding 1, stride 2: each
  // window sees one pixel, in the opposite corner.
  const std::vector<float> image = {1, 2, 3, 4};
  std::vector<float> col(16, 99.0f);
  im2col(image.data(), 1, 2, 2, 2, 1, 2, col.data());
  EXPECT_EQ(col, (std::vector<float>{0, 0, 0, 4, 0, 0, 3, 0, 0, 2, 0, 0, 1, 0, 0, 0}));
  std::vector<float> back(4, 42.0f);
  col2im(col.data(), 1, 2, 2, 2, 1, 2, back.data());
  EXPECT_EQ(back, image) << "the image is cleared first and padding cells skipped";

  // Applied to ones, col2im(im2col(.)) counts the windows covering each pixel.
  std::vector<float> ones(16, 1.0f);
  std::vector<float> windows(4 * 9);
  im2col(ones.data(), 1, 4, 4, 3, 0, 1, windows.data());
  std::vector<float> counts(16);
  col2im(windows.data(), 1, 4, 4, 3, 0, 1, counts.data());
  EXPECT_EQ(counts, (std::vector<float>{1, 2, 2, 1, 2, 4, 4, 2, 2, 4, 4, 2, 1, 2, 2, 1}));
}

}  // namespace
}  // namespace nn
