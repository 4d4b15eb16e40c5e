#include "alignment/sift_pyramid.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <random>
#include <vector>

namespace SDMCore {
namespace {

std::vector<uint8_t> RandomPixels(size_t count, uint32_t seed) {
  std::mt19937 generator(seed);
  std::vector<uint8_t> pixels(count);
  for (uint8_t& p : pixels) p = static_cast<uint8_t>(generator());
  return pixels;
}

// A smooth grey image with some structure, so that descriptors are not noise.
std::vector<uint8_t> BlobPixels(int width, int height) {
  std::vector<uint8_t> pixels(static_cast<size_t>(width) * height);
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      const double v = 128 + 60 * std::sin(x * 0.21) * std::cos(y * 0.13) + 40 * std::sin((x + y) * 0.05);
      pixels[static_cast<size_t>(y) * width + x] = static_cast<uint8_t>(std::clamp(v, 0.0, 255.0));
    }
  }
  return pixels;
}

// The descriptor as a plain transcription: range tests per corner, the weight
// and ratio per sample, the gradient from the level's pixels.
void ReferenceDescriptor(const SiftPyramid& pyramid, float x, float y, float level, float& norm,
                         uint8_t out[128]) {
  float h[128] = {};
  const int xi = static_cast<int>(static_cast<double>(x) + 0.5);
  const int yi = static_cast<int>(static_cast<double>(y) + 0.5);
  const int s = static_cast<int>(static_cast<double>(level) + 0.5);
  const float ox = static_cast<float>(xi) - x;
  const float oy = static_cast<float>(yi) - y;
  // k^s by repeated squaring.
  float power = 1.0f;
  float base = pyramid.sigmaRatio();
  for (int e = s; e > 0; e >>= 1) {
    if (e & 1) power *= base;
    base *= base;
  }
  const float binW = power * 0.8f * 4.0f;
  const int R = static_cast<int>(static_cast<double>(binW) * std::sqrt(2.0) * 4.0 * 0.5 + 0.5);
  const int width = static_cast<int>(pyramid.width());
  const int height = static_cast<int>(pyramid.height());
  const FloatImage& image = pyramid.level(s);
  for (int dy = std::max(-R, 1 - yi); dy <= std::min(height - yi - 2, R); ++dy) {
    for (int dx = std::max(-R, 1 - xi); dx <= std::min(width - xi - 2, R); ++dx) {
      const int cx = xi + dx;
      const int cy = yi + dy;
      const float gx = image.row(cy)[cx + 1] - image.row(cy)[cx - 1];
      const float gy = image.row(cy + 1)[cx] - image.row(cy - 1)[cx];
      const GradientCell cell = gradientCell(gx, gy);
      const float fy = (dy + oy) / binW - 0.5f;
      const float fx = (dx + ox) / binW - 0.5f;
      const int row0 = static_cast<int>(std::floor(fy));
      const int col0 = static_cast<int>(std::floor(fx));
      const float ty = fy - row0;
      const float tx = fx - col0;
      const float m = cell.magnitude * cell.mainWeight;
      const float ratio = cell.secondWeight / (cell.mainWeight + 0.000001f);
      const struct {
        int row, col;
        float weight;
      } corners[4] = {{row0, col0, std::fabs(m * (1 - tx) * (1 - ty))},
                      {row0 + 1, col0, std::fabs(m * (1 - tx) * ty)},
                      {row0, col0 + 1, std::fabs(m * tx * (1 - ty))},
                      {row0 + 1, col0 + 1, std::fabs(m * tx * ty)}};
      for (const auto& corner : corners) {
        if (corner.row < -2 || corner.row > 1 || corner.col < -2 || corner.col > 1) continue;
        const int base = ((corner.row + 2) * 4 + (corner.col + 2)) * 8;
        h[base + cell.mainBin] += corner.weight;
        h[base + cell.secondBin] += corner.weight * ratio;
      }
    }
  }
  // The sum of squares in four interleaved partial sums, as the library adds
  // them (the order of this sum is the implementer's choice).
  auto sumOfSquares = [](const float* v) {
    float s[4] = {0, 0, 0, 0};
    for (int i = 0; i < 128; ++i) s[i % 4] += v[i] * v[i];
    return (s[0] + s[1]) + (s[2] + s[3]);
  };
  const float total = std::sqrt(sumOfSquares(h));
  norm = total;
  if (total <= 0.5f) {
    norm = 0;
    return;
  }
  for (float& v : h) v = std::min(v / total, 0.2f);
  const float length = std::sqrt(sumOfSquares(h));
  for (int i = 0; i < 128; ++i) out[i] = static_cast<uint8_t>(static_cast<int>(h[i] / length * 255 + 0.5f));
}

TEST(GaussianKernelTest, RadiiOfTheBaseAndOfTheLevelsForThreeScales) {
  EXPECT_EQ(gaussianKernel(std::sqrt(0.8f * 0.8f - 0.5f * 0.5f)).size(), 5u);
  const float k = static_cast<float>(std::pow(2.0, 1.0 / 3));
  float sigma = std::sqrt(k * k - 1.0f) * 0.8f;
  const size_t sizes[] = {5, 7, 7, 9, 11};
  for (size_t expected : sizes) {
    EXPECT_EQ(gaussianKernel(sigma).size(), expected) << sigma;
    sigma *= k;
  }
}

TEST(GaussianKernelTest, IsTheNormalisedIntegratedGaussian) {
  for (float sigma : {0.3f, 0.6244998f, 1.226f, 2.0f, 5.0f}) {
    const std::vector<float> kernel = gaussianKernel(sigma);
    const int r = static_cast<int>(kernel.size() / 2);
    double total = 0;
    for (float w : kernel) total += w;
    EXPECT_NEAR(total, 1.0, 1e-6);
    for (int i = 0; i <= r; ++i) {
      EXPECT_EQ(kernel[r - i], kernel[r + i]);
      // The probability mass of the pixel [i - 0.5, i + 0.5].
      const double mass = 0.5 * (std::erf((i + 0.5) / (sigma * std::sqrt(2.0))) -
                                 std::erf((i - 0.5) / (sigma * std::sqrt(2.0))));
      EXPECT_NEAR(kernel[r + i], mass / (1.0 - std::erfc((r + 0.5) / (sigma * std::sqrt(2.0)))), 2e-7)
          << sigma << " " << i;
    }
  }
  EXPECT_EQ(gaussianKernel(0.1f).size(), 1u);
  EXPECT_EQ(gaussianKernel(0.1f)[0], 1.0f);
}

// Separable convolution as told: rows, then columns, each through a line with
// replicated ends.
std::vector<float> ReferenceConvolution(const std::vector<float>& src, int width, int height,
                                        const std::vector<float>& kernel) {
  const int r = static_cast<int>(kernel.size() / 2);
  std::vector<float> dst(src.size());
  std::vector<float> line;
  for (int y = 0; y < height; ++y) {
    line.assign(r, src[y * width]);
    line.insert(line.end(), src.begin() + y * width, src.begin() + (y + 1) * width);
    line.insert(line.end(), r, src[y * width + width - 1]);
    for (int i = 0; i < width; ++i) {
      float sum = 0;
      for (size_t j = 0; j < kernel.size(); ++j) sum += kernel[j] * line[i + j];
      dst[y * width + i] = sum;
    }
  }
  for (int x = 0; x < width; ++x) {
    line.assign(r, dst[x]);
    for (int y = 0; y < height; ++y) line.push_back(dst[y * width + x]);
    line.insert(line.end(), r, dst[(height - 1) * width + x]);
    for (int i = 0; i < height; ++i) {
      float sum = 0;
      for (size_t j = 0; j < kernel.size(); ++j) sum += kernel[j] * line[i + j];
      dst[i * width + x] = sum;
    }
  }
  return dst;
}

TEST(ConvolveSeparableTest, MatchesTheColumnByColumnTranscription) {
  const std::vector<uint8_t> bytes = RandomPixels(37 * 29, 5);
  std::vector<float> src(bytes.begin(), bytes.end());
  for (float sigma : {0.6f, 0.9f, 1.6f, 3.0f}) {
    const std::vector<float> kernel = gaussianKernel(sigma);
    std::vector<float> dst(src.size());
    convolveSeparable(src.data(), 37, 29, kernel.data(), static_cast<int>(kernel.size() / 2), dst.data());
    EXPECT_EQ(dst, ReferenceConvolution(src, 37, 29, kernel)) << sigma;
  }
  // An image narrower than the kernel.
  const std::vector<float> kernel = gaussianKernel(1.6f);
  std::vector<float> narrow(src.begin(), src.begin() + 3 * 2);
  std::vector<float> dst(narrow.size());
  convolveSeparable(narrow.data(), 3, 2, kernel.data(), static_cast<int>(kernel.size() / 2), dst.data());
  EXPECT_EQ(dst, ReferenceConvolution(narrow, 3, 2, kernel));
}

TEST(ConvolveSeparableTest, OneTapKernelScalesTwice) {
  const float kernel[] = {0.5f};
  const float src[] = {1.0f, 2.0f, 3.0f, 4.0f};
  float dst[4];
  convolveSeparable(src, 2, 2, kernel, 0, dst);
  EXPECT_EQ(dst[3], 1.0f);
  EXPECT_EQ(dst[0], 0.25f);
}

TEST(OrientationTest, HorizontalAxisTakesTheElseBranch) {
  EXPECT_EQ(fastAngle(1.0f, 0.0f), 0.0f);
  const GradientCell cell = gradientCell(2.0f, 0.0f);
  EXPECT_EQ(cell.magnitude, 2.0f);
  EXPECT_EQ(cell.mainBin, 0);
  EXPECT_EQ(cell.secondBin, 7);
  EXPECT_EQ(cell.mainWeight, 1.0f);
  EXPECT_EQ(cell.secondWeight, 0.0f);
}

TEST(OrientationTest, AngleJustBelowTwoPiWrapsToBinZero) {
  const float angle = std::nextafter(kTwoPi, 0.0f);
  const float p = angle * 8.0f / kTwoPi;
  ASSERT_LT(p, 8.0f);
  const GradientCell cell = splitOrientation(angle, 1.0f);
  EXPECT_EQ(cell.mainBin, 0);
  EXPECT_EQ(cell.secondBin, 7);
  EXPECT_EQ(cell.mainWeight, 1.0f - (8.0f - p));
  EXPECT_EQ(cell.secondWeight, 8.0f - p);
  // Exactly two pi: p is 8, the else-branch with weights 1 and 0.
  const GradientCell full = splitOrientation(kTwoPi, 1.0f);
  EXPECT_EQ(full.mainBin, 0);
  EXPECT_EQ(full.secondBin, 7);
  EXPECT_EQ(full.mainWeight, 1.0f);
}

TEST(OrientationTest, SplitGoesToTheNeighbourOnTheSideOfTheAngle) {
  const float binAngle = kTwoPi / 8.0f;
  const GradientCell above = splitOrientation(3.25f * binAngle, 1.0f);
  EXPECT_EQ(above.mainBin, 3);
  EXPECT_EQ(above.secondBin, 4);
  EXPECT_NEAR(above.secondWeight, 0.25f, 1e-5f);
  EXPECT_EQ(above.mainWeight + above.secondWeight, 1.0f);
  const GradientCell below = splitOrientation(2.75f * binAngle, 1.0f);
  EXPECT_EQ(below.mainBin, 3);
  EXPECT_EQ(below.secondBin, 2);
  const GradientCell last = splitOrientation(7.25f * binAngle, 1.0f);
  EXPECT_EQ(last.mainBin, 7);
  EXPECT_EQ(last.secondBin, 0);
  const GradientCell first = splitOrientation(0.25f * binAngle, 1.0f);
  EXPECT_EQ(first.mainBin, 0);
  EXPECT_EQ(first.secondBin, 1);
}

TEST(OrientationTest, FastAngleFollowsTheQuadrants) {
  EXPECT_EQ(fastAngle(0.0f, 0.0f), 0.0f);
  EXPECT_EQ(fastAngle(0.0f, 1.0f), kHalfPi);
  EXPECT_EQ(fastAngle(0.0f, -1.0f), -kHalfPi + kTwoPi);
  EXPECT_EQ(fastAngle(-1.0f, 0.0f), kPi);
  // |r| <= 1: r / (0.28 r^2 + 1).
  EXPECT_EQ(fastAngle(2.0f, 1.0f), 0.5f / (0.5f * 0.28f * 0.5f + 1.0f));
  // |r| > 1: HALF_PI - r / (r^2 + 0.28).
  EXPECT_EQ(fastAngle(1.0f, 2.0f), kHalfPi - 2.0f / (2.0f * 2.0f + 0.28f));
  std::mt19937 generator(7);
  std::uniform_real_distribution<float> value(-1.0f, 1.0f);
  for (int i = 0; i < 2000; ++i) {
    const float dx = value(generator);
    const float dy = value(generator);
    const float a = fastAngle(dx, dy);
    ASSERT_GE(a, 0.0f);
    ASSERT_LT(a, kTwoPi);
    double exact = std::atan2(dy, dx);
    if (exact < 0) exact += 2 * M_PI;
    double error = std::fabs(a - exact);
    error = std::min(error, 2 * M_PI - error);
    ASSERT_LT(error, 0.0061) << dx << " " << dy;
  }
}

TEST(SiftPyramidTest, RadiiAndBinWidthsForThreeScales) {
  const SiftPyramid pyramid(20, 20, 3);
  EXPECT_EQ(pyramid.binWidth(0), 0.8f * 4.0f);
  EXPECT_EQ(pyramid.radius(0), 9);
  EXPECT_EQ(pyramid.radius(1), 11);
  EXPECT_EQ(pyramid.radius(2), 14);
  EXPECT_EQ(pyramid.sigmaRatio(), static_cast<float>(std::pow(2.0, 1.0 / 3)));
}

TEST(SiftPyramidTest, LevelsZeroToSPlusTwo) {
  const std::vector<uint8_t> pixels = BlobPixels(40, 30);
  SiftPyramid pyramid(40, 30, 3);
  pyramid.buildBase(40, 30, pixels.data());
  pyramid.buildLevels();
  for (size_t i = 0; i <= 5; ++i) {
    EXPECT_EQ(pyramid.level(i).width, 40u);
    EXPECT_EQ(pyramid.level(i).height, 30u);
  }
  // Each level is the one below blurred by the next kernel.
  const float k = pyramid.sigmaRatio();
  float sigma = std::sqrt(k * k - 1.0f) * 0.8f;
  for (size_t i = 0; i < 5; ++i) {
    const std::vector<float> kernel = gaussianKernel(sigma);
    const std::vector<float> below(pyramid.level(i).pixels, pyramid.level(i).pixels + 1200);
    EXPECT_EQ(ReferenceConvolution(below, 40, 30, kernel),
              std::vector<float>(pyramid.level(i + 1).pixels, pyramid.level(i + 1).pixels + 1200));
    sigma *= k;
  }
  // The base: bytes / 255 blurred by the kernel of sigma sqrt(0.8^2 - 0.5^2).
  std::vector<float> scaled(pixels.begin(), pixels.end());
  for (float& v : scaled) v /= 255.0f;
  EXPECT_EQ(ReferenceConvolution(scaled, 40, 30, gaussianKernel(std::sqrt(0.8f * 0.8f - 0.25f))),
            std::vector<float>(pyramid.level(0).pixels, pyramid.level(0).pixels + 1200));
}

TEST(SiftPyramidTest, FlatPatchLeavesTheOutputUntouched) {
  const std::vector<uint8_t> pixels(50 * 50, 200);
  SiftPyramid pyramid(50, 50, 3);
  pyramid.buildBase(50, 50, pixels.data());
  pyramid.buildLevels();
  uint8_t out[128];
  for (int i = 0; i < 128; ++i) out[i] = static_cast<uint8_t>(i * 3 + 1);
  float norm = -1.0f;
  pyramid.computeDescriptor(25.0f, 25.0f, 1.0f, norm, out);
  EXPECT_EQ(norm, 0.0f);
  for (int i = 0; i < 128; ++i) EXPECT_EQ(out[i], static_cast<uint8_t>(i * 3 + 1));
}

TEST(SiftPyramidTest, GradientsAreFilledOnFirstUseOnly) {
  const std::vector<uint8_t> pixels = BlobPixels(40, 40);
  SiftPyramid pyramid(40, 40, 3);
  pyramid.buildBase(40, 40, pixels.data());
  pyramid.buildLevels();
  for (size_t i = 0; i <= 5; ++i) EXPECT_FALSE(pyramid.hasGradient(i));
  uint8_t out[128] = {};
  float norm = 0;
  pyramid.computeDescriptor(20.0f, 20.0f, 2.0f, norm, out);
  EXPECT_TRUE(pyramid.hasGradient(2));
  EXPECT_FALSE(pyramid.hasGradient(0));
  EXPECT_GT(norm, 0.5f);
}

TEST(SiftPyramidTest, DescriptorIsNormalisedClampedAndScaled) {
  const std::vector<uint8_t> pixels = BlobPixels(60, 60);
  SiftPyramid pyramid(60, 60, 3);
  pyramid.buildBase(60, 60, pixels.data());
  pyramid.buildLevels();
  uint8_t out[128] = {};
  float norm = 0;
  pyramid.computeDescriptor(30.2f, 29.7f, 0.0f, norm, out);
  ASSERT_GT(norm, 0.5f);
  double length = 0;
  for (uint8_t v : out) length += (v / 255.0) * (v / 255.0);
  EXPECT_NEAR(std::sqrt(length), 1.0, 0.03);
}

TEST(SiftPyramidTest, DescriptorsMatchThePlainTranscription) {
  const int width = 97;
  const int height = 83;
  for (int image = 0; image < 2; ++image) {
    const std::vector<uint8_t> pixels = image == 0 ? RandomPixels(width * height, 11) : BlobPixels(width, height);
    SiftPyramid pyramid(width, height, 3);
    pyramid.buildBase(width, height, pixels.data());
    pyramid.buildLevels();
    std::mt19937 generator(13 + image);
    std::uniform_real_distribution<float> coordinate(-20.0f, 110.0f);
    std::vector<std::pair<float, float>> points = {
        {48.5f, 40.5f}, {-0.5f, 10.0f}, {0.0f, 0.0f}, {96.0f, 40.0f}, {95.6f, 82.0f},
        {1.0f, 1.0f},   {50.0f, 81.4f}, {-3.5f, -2.5f}, {200.0f, 40.0f}, {12.25f, 70.75f}};
    for (int i = 0; i < 300; ++i) points.emplace_back(coordinate(generator), coordinate(generator));
    for (int level = 0; level <= 3; ++level) {
      for (const auto& point : points) {
        uint8_t expected[128];
        uint8_t actual[128];
        for (int i = 0; i < 128; ++i) expected[i] = actual[i] = static_cast<uint8_t>(255 - i);
        float expectedNorm = -1;
        float actualNorm = -2;
        ReferenceDescriptor(pyramid, point.first, point.second, static_cast<float>(level), expectedNorm,
                            expected);
        pyramid.computeDescriptor(point.first, point.second, static_cast<float>(level), actualNorm, actual);
        ASSERT_EQ(actualNorm, expectedNorm) << point.first << "," << point.second << " level " << level;
        ASSERT_EQ(std::memcmp(actual, expected, 128), 0)
            << point.first << "," << point.second << " level " << level;
      }
    }
  }
}

TEST(SiftPyramidTest, PointOnTheLastColumnSamplesOnlyToItsLeft) {
  const std::vector<uint8_t> pixels = BlobPixels(40, 40);
  SiftPyramid pyramid(40, 40, 3);
  pyramid.buildBase(40, 40, pixels.data());
  pyramid.buildLevels();
  uint8_t expected[128] = {};
  uint8_t actual[128] = {};
  float expectedNorm = 0;
  float actualNorm = 0;
  ReferenceDescriptor(pyramid, 39.0f, 20.0f, 0.0f, expectedNorm, expected);
  pyramid.computeDescriptor(39.0f, 20.0f, 0.0f, actualNorm, actual);
  EXPECT_GT(actualNorm, 0.5f);
  EXPECT_EQ(actualNorm, expectedNorm);
  EXPECT_EQ(std::memcmp(actual, expected, 128), 0);
}

TEST(SiftPyramidTest, HalfCoordinatesRoundTowardZeroAfterAddingAHalf) {
  // 10.5 rounds to 11, -0.5 to 0 (truncation of 0.0), -1.5 to 0 (of -1.0).
  const std::vector<uint8_t> pixels = BlobPixels(40, 40);
  SiftPyramid pyramid(40, 40, 3);
  pyramid.buildBase(40, 40, pixels.data());
  pyramid.buildLevels();
  for (float x : {10.5f, -0.5f, -1.5f}) {
    uint8_t expected[128] = {};
    uint8_t actual[128] = {};
    float expectedNorm = 0;
    float actualNorm = 0;
    ReferenceDescriptor(pyramid, x, 20.0f, 1.0f, expectedNorm, expected);
    pyramid.computeDescriptor(x, 20.0f, 1.0f, actualNorm, actual);
    EXPECT_EQ(actualNorm, expectedNorm) << x;
    EXPECT_EQ(std::memcmp(actual, expected, 128), 0) << x;
  }
}


TEST(SiftPyramidTest, BuildingFewerLevelsGivesTheSameLowerLevels) {
  const std::vector<uint8_t> pixels = BlobPixels(45, 38);
  SiftPyramid all(45, 38, 3);
  all.buildBase(45, 38, pixels.data());
  all.buildLevels();
  SiftPyramid some(45, 38, 3);
  some.buildBase(45, 38, pixels.data());
  some.buildLevels(2);
  for (size_t i = 0; i <= 2; ++i) {
    EXPECT_EQ(std::memcmp(all.level(i).pixels, some.level(i).pixels, 45 * 38 * sizeof(float)), 0) << i;
  }
  uint8_t a[128] = {};
  uint8_t b[128] = {};
  float na = 0;
  float nb = 0;
  all.computeDescriptor(20.3f, 17.8f, 2.0f, na, a);
  some.computeDescriptor(20.3f, 17.8f, 2.0f, nb, b);
  EXPECT_EQ(na, nb);
  EXPECT_EQ(std::memcmp(a, b, 128), 0);
}

// Images with exact zeros and exact diagonals in their differences: steps,
// a checkerboard and flat areas, so that every branch of the orientation
// (dx = 0, dy = 0, |r| = 1, the wrap at two pi) is met.
TEST(SiftPyramidTest, DescriptorsOfStructuredImagesMatchThePlainTranscription) {
  const int width = 64;
  const int height = 48;
  std::vector<std::vector<uint8_t>> images;
  std::vector<uint8_t> steps(width * height);
  std::vector<uint8_t> checker(width * height);
  std::vector<uint8_t> diagonal(width * height);
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      steps[y * width + x] = static_cast<uint8_t>(x < 20 ? 10 : x < 40 ? 200 : (y < 24 ? 90 : 30));
      checker[y * width + x] = static_cast<uint8_t>(((x / 6) + (y / 6)) % 2 ? 250 : 5);
      diagonal[y * width + x] = static_cast<uint8_t>(x + y < 50 ? 0 : x - y > 10 ? 255 : 128);
    }
  }
  images = {steps, checker, diagonal};
  for (const std::vector<uint8_t>& pixels : images) {
    SiftPyramid pyramid(width, height, 3);
    pyramid.buildBase(width, height, pixels.data());
    pyramid.buildLevels();
    for (int level = 0; level <= 5; ++level) {
      for (float y = 2.0f; y < height; y += 5.5f) {
        for (float x = 1.0f; x < width; x += 4.75f) {
          uint8_t expected[128] = {};
          uint8_t actual[128] = {};
          float expectedNorm = -1;
          float actualNorm = -2;
          ReferenceDescriptor(pyramid, x, y, static_cast<float>(level), expectedNorm, expected);
          pyramid.computeDescriptor(x, y, static_cast<float>(level), actualNorm, actual);
          ASSERT_EQ(actualNorm, expectedNorm) << x << "," << y << " level " << level;
          ASSERT_EQ(std::memcmp(actual, expected, 128), 0) << x << "," << y << " level " << level;
        }
      }
    }
  }
}

TEST(SiftPyramidTest, FourAndEightLaneHistogramLoopsGiveTheSameBytes) {
  const int width = 97;
  const int height = 83;
  const std::vector<uint8_t> pixels = RandomPixels(width * height, 21);
  SiftPyramid pyramid(width, height, 3);
  pyramid.buildBase(width, height, pixels.data());
  pyramid.buildLevels();
  std::mt19937 generator(22);
  std::uniform_real_distribution<float> coordinate(-5.0f, 100.0f);
  for (int i = 0; i < 200; ++i) {
    const float x = coordinate(generator);
    const float y = coordinate(generator);
    const float level = static_cast<float>(i % 4);
    uint8_t expected[128] = {};
    uint8_t narrow[128] = {};
    uint8_t wide[128] = {};
    float expectedNorm = 0;
    float narrowNorm = 0;
    float wideNorm = 0;
    ReferenceDescriptor(pyramid, x, y, level, expectedNorm, expected);
    SiftPyramid::setWideHistogramRows(false);
    pyramid.computeDescriptor(x, y, level, narrowNorm, narrow);
    SiftPyramid::setWideHistogramRows(true);
    pyramid.computeDescriptor(x, y, level, wideNorm, wide);
    ASSERT_EQ(narrowNorm, expectedNorm);
    ASSERT_EQ(wideNorm, expectedNorm);
    ASSERT_EQ(std::memcmp(narrow, expected, 128), 0) << x << "," << y;
    ASSERT_EQ(std::memcmp(wide, expected, 128), 0) << x << "," << y;
  }
  SiftPyramid::setWideHistogramRows(true);
}

}  // namespace
}  // namespace SDMCore
