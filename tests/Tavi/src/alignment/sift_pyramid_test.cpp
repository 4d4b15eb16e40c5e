#include "alignment/sift_pyramid.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <random>
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

// The descriptor as a plain transcription: range tests per corner, the weight
// and ratio per sample, the gradient from the level's pixels.
void ReferenceDescriptor(const SiftPyramid& pyramid, float x, float y, int s, float& norm, uint8_t out[128]) {
  float h[128] = {};
  const int xi = static_cast<int>(static_cast<double>(x) + 0.5);
  const int yi = static_cast<int>(static_cast<double>(y) + 0.5);
  const float ox = static_cast<float>(xi) - x;
  const float oy = static_cast<float>(yi) - y;
  float power = 1.0f;  // k^s by repeated squaring
  float base = pyramid.sigmaRatio();
  for (int e = s; e > 0; e >>= 1, base *= base) power *= e & 1 ? base : 1.0f;
  const float binW = power * 0.8f * 4.0f;
  const int R = static_cast<int>(static_cast<double>(binW) * std::sqrt(2.0) * 4.0 * 0.5 + 0.5);
  const int width = static_cast<int>(pyramid.width()), height = static_cast<int>(pyramid.height());
  const FloatImage& image = pyramid.level(s);
  for (int dy = std::max(-R, 1 - yi); dy <= std::min(height - yi - 2, R); ++dy) {
    for (int dx = std::max(-R, 1 - xi); dx <= std::min(width - xi - 2, R); ++dx) {
      const int cx = xi + dx, cy = yi + dy;
      const GradientCell cell = gradientCell(image.row(cy)[cx + 1] - image.row(cy)[cx - 1],
                                             image.row(cy + 1)[cx] - image.row(cy - 1)[cx]);
      const float fy = (dy + oy) / binW - 0.5f;
      const float fx = (dx + ox) / binW - 0.5f;
      const int row0 = static_cast<int>(std::floor(fy));
      const int col0 = static_cast<int>(std::floor(fx));
      const float ty = fy - row0;
      const float tx = fx - col0;
      const float m = cell.magnitude * cell.mainWeight;
      const float ratio = cell.secondWeight / (cell.mainWeight + 0.000001f);
      // Corners (row0, col0), (row0 + 1, col0), (row0, col0 + 1), (row0 + 1, col0 + 1).
      for (int corner = 0; corner < 4; ++corner) {
        const int row = row0 + (corner & 1);
        const int col = col0 + (corner >> 1);
        if (row < -2 || row > 1 || col < -2 || col > 1) continue;
        const float weight = std::fabs(m * (corner >> 1 ? tx : 1 - tx) * (corner & 1 ? ty : 1 - ty));
        h[((row + 2) * 4 + (col + 2)) * 8 + cell.mainBin] += weight;
        h[((row + 2) * 4 + (col + 2)) * 8 + cell.secondBin] += weight * ratio;
      }
    }
  }
  // Four interleaved partial sums, the library's (free) order of the norm.
  auto length = [](const float* v) {
    float sums[4] = {0, 0, 0, 0};
    for (int i = 0; i < 128; ++i) sums[i % 4] += v[i] * v[i];
    return std::sqrt((sums[0] + sums[1]) + (sums[2] + sums[3]));
  };
  const float total = length(h);
  norm = total > 0.5f ? total : 0.0f;
  if (total <= 0.5f) return;
  for (float& v : h) v = std::min(v / total, 0.2f);
  const float clamped = length(h);
  for (int i = 0; i < 128; ++i) out[i] = static_cast<uint8_t>(static_cast<int>(h[i] / clamped * 255 + 0.5f));
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

TEST(GaussianKernelTest, IsTheNormalisedIntegratedGaussianWithTheRadiiForThreeScales) {
  const std::vector<float> kernel = gaussianKernel(1.226f);
  const int r = static_cast<int>(kernel.size() / 2);
  const double t = 1.0 / (1.226 * std::sqrt(2.0));
  for (int i = 0; i <= r; ++i) {
    EXPECT_EQ(kernel[r - i], kernel[r + i]);
    const double mass = 0.5 * (std::erf((i + 0.5) * t) - std::erf((i - 0.5) * t));
    EXPECT_NEAR(kernel[r + i], mass / (1.0 - std::erfc((r + 0.5) * t)), 2e-7) << i;
  }
  EXPECT_EQ(gaussianKernel(0.1f), std::vector<float>{1.0f});
  // The base kernel, the five level kernels of S = 3, and the descriptor radii
  // of levels 0 to 2.
  EXPECT_EQ(gaussianKernel(std::sqrt(0.8f * 0.8f - 0.5f * 0.5f)).size(), 5u);
  const SiftPyramid pyramid(20, 20, 3);
  const float k = pyramid.sigmaRatio();
  EXPECT_EQ(k, static_cast<float>(std::pow(2.0, 1.0 / 3)));
  float sigma = std::sqrt(k * k - 1.0f) * 0.8f;
  for (size_t expected : {5, 7, 7, 9, 11}) {
    EXPECT_EQ(gaussianKernel(sigma).size(), expected) << sigma;
    sigma *= k;
  }
  EXPECT_EQ(pyramid.radius(0), 9);
  EXPECT_EQ(pyramid.radius(1), 11);
  EXPECT_EQ(pyramid.radius(2), 14);
}

TEST(SiftPyramidTest, LevelsAreSuccessiveBlursOfTheScaledBase) {
  const std::vector<uint8_t> pixels = RandomPixels(40 * 30, 5);
  SiftPyramid pyramid(40, 30, 3);
  pyramid.buildBase(40, 30, pixels.data());
  pyramid.buildLevels();
  std::vector<float> scaled(pixels.begin(), pixels.end());
  for (float& v : scaled) v /= 255.0f;
  EXPECT_LT(DistanceFromOpenCv(scaled.data(), pyramid.level(0).pixels, 40, 30,
                               gaussianKernel(std::sqrt(0.8f * 0.8f - 0.25f))), 1e-6);
  const float k = pyramid.sigmaRatio();
  float sigma = std::sqrt(k * k - 1.0f) * 0.8f;
  for (size_t i = 1; i <= 5; ++i, sigma *= k) {
    EXPECT_LT(DistanceFromOpenCv(pyramid.level(i - 1).pixels, pyramid.level(i).pixels, 40, 30,
                                 gaussianKernel(sigma)), 1e-6) << i;
  }
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

// Just below two pi, bin 8 wraps to 0 and the neighbour is 7; exactly 0 on
// the horizontal axis is all in bin 0; elsewhere the neighbour is on the
// angle's side of the bin centre. The fast angle follows the quadrants and
// stays within 0.0061 of atan2.
TEST(OrientationTest, SplitBetweenTheNearestBinAndItsNeighbourOfAFastAngle) {
  const float angle = std::nextafter(kTwoPi, 0.0f);
  const float p = angle * 8.0f / kTwoPi;
  ASSERT_LT(p, 8.0f);
  const GradientCell wrap = splitOrientation(angle, 1.0f);
  EXPECT_EQ(wrap.mainBin, 0);
  EXPECT_EQ(wrap.secondBin, 7);
  EXPECT_EQ(wrap.mainWeight, 1.0f - (8.0f - p));
  EXPECT_EQ(wrap.secondWeight, 8.0f - p);
  const GradientCell axis = gradientCell(2.0f, 0.0f);
  EXPECT_EQ(axis.magnitude, 2.0f);
  EXPECT_EQ(axis.mainBin, 0);
  EXPECT_EQ(axis.secondBin, 7);
  EXPECT_EQ(axis.mainWeight, 1.0f);
  const GradientCell above = splitOrientation(3.25f * kTwoPi / 8, 1.0f);
  EXPECT_EQ(above.mainBin, 3);
  EXPECT_EQ(above.secondBin, 4);
  EXPECT_NEAR(above.secondWeight, 0.25f, 1e-5f);

  EXPECT_EQ(fastAngle(0.0f, 0.0f), 0.0f);
  EXPECT_EQ(fastAngle(0.0f, 1.0f), kHalfPi);
  EXPECT_EQ(fastAngle(0.0f, -1.0f), -kHalfPi + kTwoPi);
  EXPECT_EQ(fastAngle(-1.0f, 0.0f), kPi);
  EXPECT_EQ(fastAngle(2.0f, 1.0f), 0.5f / (0.5f * 0.28f * 0.5f + 1.0f));
  EXPECT_EQ(fastAngle(1.0f, 2.0f), kHalfPi - 2.0f / (2.0f * 2.0f + 0.28f));
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

// Noise, and steps, a checkerboard and diagonals whose differences are exactly
// 0 or on the diagonal, so that every branch of the orientation is met. The
// points take in half coordinates, negative ones, the last column and points
// off the image (which leave the output as it was); both histogram loops
// must give the same bytes.
TEST(SiftPyramidTest, DescriptorsMatchThePlainTranscription) {
  const int width = 97;
  const int height = 83;
  std::vector<std::vector<uint8_t>> images = {RandomPixels(width * height, 11),
                                              std::vector<uint8_t>(width * height)};
  for (int i = 0; i < width * height; ++i) {
    const int x = i % width, y = i / width;
    images[1][i] = static_cast<uint8_t>(x < 20 ? 10 : x < 40 ? 200 : x < 70 ? ((x / 6 + y / 6) % 2 ? 250 : 5)
                                                                           : (x + y < 120 ? 0 : 128));
  }
  std::vector<std::pair<float, float>> points = {
      {48.5f, 40.5f}, {10.5f, 20.0f}, {-0.5f, 10.0f}, {-1.5f, 30.0f}, {0.0f, 0.0f},   {96.0f, 40.0f},
      {95.6f, 82.0f}, {1.0f, 1.0f},   {50.0f, 81.4f}, {-3.5f, -2.5f}, {200.0f, 40.0f}, {12.25f, 70.75f}};
  std::mt19937 generator(13);
  std::uniform_real_distribution<float> coordinate(-20.0f, 110.0f);
  for (int i = 0; i < 150; ++i) points.emplace_back(coordinate(generator), coordinate(generator));
  for (const std::vector<uint8_t>& pixels : images) {
    SiftPyramid pyramid(width, height, 3);
    pyramid.buildBase(width, height, pixels.data());
    pyramid.buildLevels();
    for (int level = 0; level <= 5; ++level) {
      for (const auto& [x, y] : points) {
        uint8_t expected[128];
        float expectedNorm = -1;
        for (int i = 0; i < 128; ++i) expected[i] = static_cast<uint8_t>(255 - i);
        ReferenceDescriptor(pyramid, x, y, level, expectedNorm, expected);
        for (bool wide : {false, true}) {
          SiftPyramid::setWideHistogramRows(wide);
          uint8_t actual[128];
          float actualNorm = -2;
          for (int i = 0; i < 128; ++i) actual[i] = static_cast<uint8_t>(255 - i);
          // The level is rounded to the nearest whole one.
          pyramid.computeDescriptor(x, y, static_cast<float>(level) - (wide ? 0.0f : 0.4f), actualNorm, actual);
          ASSERT_EQ(actualNorm, expectedNorm) << x << "," << y << " level " << level;
          ASSERT_EQ(std::memcmp(actual, expected, 128), 0) << x << "," << y << " level " << level << " " << wide;
        }
      }
    }
  }
  SiftPyramid::setWideHistogramRows(true);
}

}  // namespace
}  // namespace SDMCore
