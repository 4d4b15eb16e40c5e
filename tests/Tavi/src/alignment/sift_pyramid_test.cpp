#include "alignment/sift_pyramid.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <random>
#include <tuple>
#include <utility>
#include <vector>

#include <opencv2/core.hpp>
#include <opencv2/imgproc.hpp>

namespace SDMCore {
namespace {

std::vector<uint8_t> RandomPixels(size_t count, uint32_t seed) {
  std::mt19937 generator(seed);
  std::vector<uint8_t> pixels(count);
  for (uint8_t& p : pixels) p = static_cast<uint8_t>(generator());
  return pixels;
}

// The largest difference from OpenCV's separable filter with replicated
// borders; the order of the sums may differ, so exact equality is not asked.
double DistanceFromOpenCv(const float* src, const float* dst, int width, int height,
                          const std::vector<float>& kernel) {
  cv::Mat expected;
  cv::sepFilter2D(cv::Mat(height, width, CV_32F, const_cast<float*>(src)), expected, CV_32F, kernel, kernel,
                  cv::Point(-1, -1), 0, cv::BORDER_REPLICATE);
  return cv::norm(expected, cv::Mat(height, width, CV_32F, const_cast<float*>(dst)), cv::NORM_INF);
}

// The integrated Gaussian of sigma over each pixel, normalised to the mass
// of the kernel's 2r + 1 pixels, r = truncate(3.5 sigma + 0.5).
std::vector<float> IntegratedGaussian(double sigma) {
  const int r = static_cast<int>(sigma * 3.5 + 0.5);
  const double t = 1.0 / (sigma * std::sqrt(2.0));
  std::vector<float> kernel;
  for (int i = -r; i <= r; ++i) {
    kernel.push_back(0.5 * (std::erf((i + 0.5) * t) - std::erf((i - 0.5) * t)) / (1.0 - std::erfc((r + 0.5) * t)));
  }
  return kernel;
}

// Level 0 is the image over 255 blurred from 0.5 to 0.8, and level i level
// i - 1 blurred by 0.8 sqrt(k^2 - 1) k^(i - 1), k = 2^(1/3).
TEST(SiftPyramidTest, LevelsAreSuccessiveIntegratedGaussianBlursOfTheScaledBase) {
  EXPECT_EQ(gaussianKernel(0.1f), std::vector<float>{1.0f});
  const std::vector<uint8_t> pixels = RandomPixels(40 * 30, 5);
  SiftPyramid pyramid(40, 30, 3);
  pyramid.buildBase(40, 30, pixels.data());
  pyramid.buildLevels();
  std::vector<float> scaled(pixels.begin(), pixels.end());
  for (float& v : scaled) v /= 255.0f;
  EXPECT_LT(DistanceFromOpenCv(scaled.data(), pyramid.level(0).pixels, 40, 30, IntegratedGaussian(std::sqrt(0.39))),
            1e-6);
  const double k = std::pow(2.0, 1.0 / 3);
  EXPECT_EQ(pyramid.sigmaRatio(), static_cast<float>(k));
  double sigma = std::sqrt(k * k - 1.0) * 0.8;
  for (size_t i = 1; i <= 5; ++i, sigma *= k) {
    EXPECT_LT(DistanceFromOpenCv(pyramid.level(i - 1).pixels, pyramid.level(i).pixels, 40, 30,
                                 IntegratedGaussian(sigma)), 1e-6) << i;
  }
  // The descriptor's sampling radii of levels 0 to 2.
  EXPECT_EQ(pyramid.radius(0), 9);
  EXPECT_EQ(pyramid.radius(1), 11);
  EXPECT_EQ(pyramid.radius(2), 14);
  // Building up to level 2 only gives the same levels 0 to 2.
  SiftPyramid some(40, 30, 3);
  some.buildBase(40, 30, pixels.data());
  some.buildLevels(2);
  EXPECT_EQ(std::memcmp(pyramid.level(2).pixels, some.level(2).pixels, 1200 * sizeof(float)), 0);
  // An image narrower than the kernel.
  const std::vector<float> kernel = gaussianKernel(1.6f);
  std::vector<float> dst(6);
  convolveSeparable(scaled.data(), 3, 2, kernel.data(), static_cast<int>(kernel.size() / 2), dst.data());
  EXPECT_LT(DistanceFromOpenCv(scaled.data(), dst.data(), 3, 2, kernel), 1e-6);
}

// Just below two pi, bin 8 wraps to 0 and the neighbour is 7; elsewhere the
// neighbour is on the angle's side of the bin centre. The fast angle is in
// [0, 2 pi) and within 0.0061 of atan2.
TEST(OrientationTest, SplitBetweenTheNearestBinAndItsNeighbourOfAFastAngle) {
  const float angle = std::nextafter(kTwoPi, 0.0f);
  const float p = angle * 8.0f / kTwoPi;
  ASSERT_LT(p, 8.0f);
  const GradientCell wrap = splitOrientation(angle, 1.0f);
  EXPECT_EQ(wrap.mainBin, 0);
  EXPECT_EQ(wrap.secondBin, 7);
  EXPECT_EQ(wrap.mainWeight, 1.0f - (8.0f - p));
  EXPECT_EQ(wrap.secondWeight, 8.0f - p);
  const GradientCell above = splitOrientation(3.25f * kTwoPi / 8, 1.0f);
  EXPECT_EQ(above.mainBin, 3);
  EXPECT_EQ(above.secondBin, 4);
  EXPECT_NEAR(above.secondWeight, 0.25f, 1e-5f);

  EXPECT_EQ(fastAngle(0.0f, 0.0f), 0.0f);
  EXPECT_EQ(fastAngle(0.0f, -1.0f), -kHalfPi + kTwoPi);
  std::mt19937 generator(7);
  std::uniform_real_distribution<float> value(-1.0f, 1.0f);
  for (int i = 0; i < 2000; ++i) {
    const float dx = value(generator);
    const float dy = value(generator);
    const float a = fastAngle(dx, dy);
    ASSERT_TRUE(a >= 0.0f && a < kTwoPi) << a;
    const double error = std::fabs(a - std::atan2(dy, dx));
    ASSERT_LT(std::min(error, std::fabs(error - 2 * M_PI)), 0.0061) << dx << " " << dy;
  }
}

// A ramp has the same gradient everywhere: along x it points at orientation
// 0, along y at 2, falling along x at 4. Each of the 16 spatial bins gets
// about a bin width of samples, a quarter of the length, which the clamp at
// 0.2 and the second normalisation make 0.25 exactly: 64 in each spatial bin
// of that orientation, 0 elsewhere.
TEST(SiftPyramidTest, ARampGives64InEachSpatialBinOfItsOrientation) {
  for (const auto& [dx, dy, bin] : {std::tuple{3, 0, 0}, {0, 3, 2}, {-3, 0, 4}}) {
    std::vector<uint8_t> pixels(64 * 64);
    for (int i = 0; i < 64 * 64; ++i) pixels[i] = static_cast<uint8_t>(96 + dx * (i % 64 - 32) + dy * (i / 64 - 32));
    SiftPyramid pyramid(64, 64, 3);
    pyramid.buildBase(64, 64, pixels.data());
    pyramid.buildLevels();
    for (float level : {0.0f, 1.0f}) {
      uint8_t out[128];
      float norm = 0.0f;
      pyramid.computeDescriptor(32.0f, 32.0f, level, norm, out);
      EXPECT_GT(norm, 0.5f);
      for (int i = 0; i < 128; ++i) ASSERT_EQ(out[i], i % 8 == bin ? 64 : 0) << i << " level " << level;
    }
  }
}

// On noise, at points with half coordinates, negative ones, on the last
// column and off the image, both histogram loops give the same bytes, and a
// level is rounded to the nearest whole one.
TEST(SiftPyramidTest, DescriptorsAgreeAcrossHistogramLoopsAndRoundTheLevel) {
  const int width = 97;
  const int height = 83;
  const std::vector<uint8_t> pixels = RandomPixels(width * height, 11);
  SiftPyramid pyramid(width, height, 3);
  pyramid.buildBase(width, height, pixels.data());
  pyramid.buildLevels();
  std::vector<std::pair<float, float>> points = {{48.5f, 40.5f}, {-1.5f, 30.0f}, {96.0f, 40.0f}, {95.6f, 82.0f},
                                                 {1.0f, 1.0f},   {-3.5f, -2.5f}, {12.25f, 70.75f}};
  std::mt19937 generator(13);
  std::uniform_real_distribution<float> coordinate(-20.0f, 110.0f);
  for (int i = 0; i < 100; ++i) points.emplace_back(coordinate(generator), coordinate(generator));
  for (int level = 0; level <= 5; ++level) {
    for (const auto& [x, y] : points) {
      uint8_t bytes[2][128];
      float norms[2] = {-1.0f, -2.0f};
      for (int road = 0; road < 2; ++road) {
        for (int i = 0; i < 128; ++i) bytes[road][i] = static_cast<uint8_t>(255 - i);
        SiftPyramid::setWideHistogramRows(road == 0);
        pyramid.computeDescriptor(x, y, static_cast<float>(level) - 0.4f * road, norms[road], bytes[road]);
      }
      ASSERT_EQ(norms[0], norms[1]) << x << "," << y << " level " << level;
      ASSERT_EQ(std::memcmp(bytes[0], bytes[1], 128), 0) << x << "," << y << " level " << level;
    }
  }
  SiftPyramid::setWideHistogramRows(true);
}

}  // namespace
}  // namespace SDMCore
