#include "nn/util/math_functions.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>
#include <vector>

namespace nn {
namespace {

TEST(MathFunctionsTest, VectorRoutinesWorkInPlace) {
  std::vector<float> a = {1, 2, 3, 4};
  const std::vector<float> b = {4, 3, 2, 1};
  vsAdd(4, a.data(), b.data(), a.data());
  EXPECT_EQ(a, (std::vector<float>{5, 5, 5, 5}));
  vsSub(4, a.data(), b.data(), a.data());
  EXPECT_EQ(a, (std::vector<float>{1, 2, 3, 4}));
  vsMul(4, a.data(), b.data(), a.data());
  EXPECT_EQ(a, (std::vector<float>{4, 6, 6, 4}));
  vsDiv(4, a.data(), b.data(), a.data());
  EXPECT_EQ(a, (std::vector<float>{1, 2, 3, 4}));
  vsSqr(4, a.data(), a.data());
  EXPECT_EQ(a, (std::vector<float>{1, 4, 9, 16}));
  vsPowx(4, a.data(), 0.5f, a.data());
  EXPECT_EQ(a, (std::vector<float>{1, 2, 3, 4}));
  vsExp(1, a.data(), a.data());
  EXPECT_FLOAT_EQ(a[0], std::exp(1.0f));

  std::vector<float> y = {1, 1, 1};
  const std::vector<float> x = {1, 2, 3};
  cblas_saxpby(3, 2.0f, x.data(), 1, -1.0f, y.data(), 1);
  EXPECT_EQ(y, (std::vector<float>{1, 3, 5}));
  nn_cpu_axpby(3, 1.0f, x.data(), 0.5f, y.data());
  EXPECT_EQ(y, (std::vector<float>{1.5f, 3.5f, 5.5f}));
  nn_add_scalar(3, -0.5f, y.data());
  EXPECT_EQ(y, (std::vector<float>{1, 3, 5}));
}

TEST(MathFunctionsTest, BadVectorArgumentsAreReportedAndLeaveTheOutputAlone) {
  std::vector<float> y = {7, 7};
  testing::internal::CaptureStderr();
  vsAdd(-1, y.data(), y.data(), y.data());
  vsSub(2, nullptr, y.data(), y.data());
  const std::string log = testing::internal::GetCapturedStderr();
  EXPECT_EQ(y, (std::vector<float>{7, 7}));
  EXPECT_NE(log.find("vsAdd"), std::string::npos);
  EXPECT_NE(log.find("vsSub"), std::string::npos);
  vsExp(0, nullptr, nullptr);  // nothing to do, nothing to report
}

TEST(MathFunctionsTest, SignAndIndexOfLargestMagnitude) {
  const float nan = std::numeric_limits<float>::quiet_NaN();
  const std::vector<float> x = {-2.0f, 0.0f, 3.0f, nan, -0.0f};
  std::vector<float> sign(5);
  nn_cpu_sign(5, x.data(), sign.data());
  EXPECT_EQ(sign, (std::vector<float>{-1, 0, 1, 0, 0}));

  const std::vector<float> tie = {0.1f, 0.5f, 0.2f, 0.5f};
  EXPECT_EQ(cblas_isamax(4, tie.data(), 1), 1u) << "the lowest index wins a tie";
  EXPECT_EQ(cblas_isamax(0, tie.data(), 1), 0u);
}

TEST(MathFunctionsTest, RandomDrawsStayInTheirRanges) {
  std::vector<float> r(1000);
  nn_rng_uniform(1000, -1.0f, 2.0f, r.data());
  for (float v : r) {
    ASSERT_GE(v, -1.0f);
    ASSERT_LE(v, 2.0f);
  }
  const float a = 1.0f;
  const float next = std::nextafter(a, 2.0f);
  nn_rng_uniform(1000, a, a, r.data());
  for (float v : r) {
    ASSERT_TRUE(v == a || v == next) << v;
  }

  nn_rng_gaussian(1000, 5.0f, 0.5f, r.data());
  double mean = 0;
  for (float v : r) {
    mean += v / 1000.0;
  }
  EXPECT_NEAR(mean, 5.0, 0.1);

  std::vector<int> bits(500, 7);
  nn_rng_bernoulli(500, 1.0, bits.data());
  EXPECT_EQ(bits, std::vector<int>(500, 1));
  nn_rng_bernoulli(500, 0.0f, bits.data());
  EXPECT_EQ(bits, std::vector<int>(500, 0));
}

TEST(MathFunctionsDeathTest, RandomDrawsCheckTheirArguments) {
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

// The column transform element by element, as a reference.
float NaiveColumnCell(const std::vector<float>& image, int height, int width, int ksize, int pad,
                      int stride, int width_col, int height_col, int index) {
  const int w = index % width_col;
  const int h = (index / width_col) % height_col;
  const int c = index / width_col / height_col;
  const int h_pad = h * stride - pad + (c / ksize) % ksize;
  const int w_pad = w * stride - pad + c % ksize;
  const int c_im = c / ksize / ksize;
  if (h_pad < 0 || h_pad >= height || w_pad < 0 || w_pad >= width) {
    return 0.0f;
  }
  return image[(c_im * height + h_pad) * width + w_pad];
}

TEST(MathFunctionsTest, Im2colMatchesTheElementwiseRuleAndCol2imIsItsAdjoint) {
  struct Case {
    int channels, height, width, ksize, pad, stride;
  };
  const Case cases[] = {{2, 5, 7, 3, 0, 1}, {3, 6, 5, 3, 1, 2}, {1, 4, 4, 5, 2, 3},
                        {2, 9, 8, 2, 0, 3}, {1, 3, 3, 3, 1, 1}};
  std::mt19937 generator(3);
  std::uniform_real_distribution<float> draw(-1, 1);
  for (const Case& k : cases) {
    const int height_col = (k.height + 2 * k.pad - k.ksize) / k.stride + 1;
    const int width_col = (k.width + 2 * k.pad - k.ksize) / k.stride + 1;
    const int image_size = k.channels * k.height * k.width;
    const int col_size = k.channels * k.ksize * k.ksize * height_col * width_col;
    std::vector<float> image(image_size);
    for (float& v : image) {
      v = draw(generator);
    }
    std::vector<float> col(col_size, 99.0f);
    im2col(image.data(), k.channels, k.height, k.width, k.ksize, k.pad, k.stride, col.data());
    for (int i = 0; i < col_size; ++i) {
      ASSERT_EQ(col[i], NaiveColumnCell(image, k.height, k.width, k.ksize, k.pad, k.stride,
                                        width_col, height_col, i))
          << "case with pad " << k.pad << " stride " << k.stride << ", cell " << i;
    }

    // <im2col(x), y> == <x, col2im(y)>
    std::vector<float> y(col_size);
    for (float& v : y) {
      v = draw(generator);
    }
    std::vector<float> back(image_size, 42.0f);
    col2im(y.data(), k.channels, k.height, k.width, k.ksize, k.pad, k.stride, back.data());
    double left = 0;
    double right = 0;
    for (int i = 0; i < col_size; ++i) {
      left += double(col[i]) * y[i];
    }
    for (int i = 0; i < image_size; ++i) {
      right += double(image[i]) * back[i];
    }
    EXPECT_NEAR(left, right, 1e-4);
  }

  // Applied to ones, col2im(im2col(.)) counts the windows covering each pixel.
  std::vector<float> ones(16, 1.0f);
  std::vector<float> col(4 * 9);
  im2col(ones.data(), 1, 4, 4, 3, 0, 1, col.data());
  std::vector<float> counts(16);
  col2im(col.data(), 1, 4, 4, 3, 0, 1, counts.data());
  EXPECT_EQ(counts, (std::vector<float>{1, 2, 2, 1, 2, 4, 4, 2, 2, 4, 4, 2, 1, 2, 2, 1}));
}

}  // namespace
}  // namespace nn
