#include "alignment/resize_antialias.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>
#include <random>
#include <vector>

#include <opencv2/core.hpp>

namespace tavilib {
namespace {

cv::Mat RandomImage(int rows, int cols, uint32_t seed) {
  cv::Mat image(rows, cols, CV_8UC3);
  std::mt19937 generator(seed);
  for (int y = 0; y < rows; ++y) {
    for (int x = 0; x < cols * 3; ++x) image.ptr<uint8_t>(y)[x] = static_cast<uint8_t>(generator());
  }
  return image;
}

bool SameImage(const cv::Mat& a, const cv::Mat& b) {
  return a.size() == b.size() && a.type() == b.type() && cv::norm(a, b, cv::NORM_INF) == 0;
}

// One pass along one axis, one output sample at a time; a horizontal pass is
// the vertical one of the transposed image.
cv::Mat ReferencePass(const cv::Mat& src, int width, int height, bool transposed = false) {
  if (src.rows == height && !transposed) return ReferencePass(src.t(), height, width, true).t();
  const float ratio = static_cast<float>(src.rows) / static_cast<float>(height);
  const float filterScale = ratio >= 1.0f ? ratio : 1.0f;
  const float support = ratio >= 1.0f ? 3.0f * ratio : 0.5f;
  cv::Mat dst(height, width, CV_8UC3);
  for (int i = 0; i < height; ++i) {
    const float centre = (static_cast<float>(i) + 0.5f) * ratio;
    const int first = static_cast<int>(std::max(0.0f, std::floor(centre - support)));
    const int last = static_cast<int>(std::min(static_cast<float>(src.rows), std::ceil(centre + support)));
    std::vector<float> weights;
    float sum = 0.0f;
    for (int j = first; j < last; ++j) {
      weights.push_back(lanczos3((static_cast<float>(j) - centre + 0.5f) * (1.0f / filterScale)) *
                        (1.0f / filterScale));
      sum += weights.back();
    }
    const float norm = sum != 0.0f ? 1.0f / sum : 1.0f;
    for (int x = 0; x < width * 3; ++x) {
      float acc = 0.0f;
      for (int j = first; j < last; ++j) acc += static_cast<float>(src.ptr<uint8_t>(j)[x]) * weights[j - first];
      const float v = acc * norm + 0.5f;
      dst.ptr<uint8_t>(i)[x] = v < 0.5f ? 0 : v >= 255.0f ? 255 : static_cast<uint8_t>(static_cast<int>(v));
    }
  }
  return dst;
}

TEST(Lanczos3Test, RangeIsHalfOpen) {
  EXPECT_EQ(lanczos3(0.0f), 1.0f);
  EXPECT_EQ(lanczos3(3.0f), 0.0f);
  EXPECT_EQ(lanczos3(-3.5f), 0.0f);
  EXPECT_EQ(lanczos3(std::numeric_limits<float>::quiet_NaN()), 0.0f);
  EXPECT_NE(lanczos3(-3.0f), 0.0f);  // evaluated: sinf's rounding leaves a trace
  EXPECT_NEAR(lanczos3(-3.0f), 0.0f, 1e-6f);
  EXPECT_NEAR(lanczos3(0.5f), 0.6079271f, 1e-6f);
  EXPECT_EQ(lanczos3(1.25f), lanczos3(-1.25f));
}

TEST(ResizeAntialiasTest, SameSizeIsTheIdentityAndOnePixelSpreadsUnchanged) {
  const cv::Mat image = RandomImage(23, 37, 1);
  EXPECT_TRUE(SameImage(resize_antialias(image, cv::Size(37, 23)), image));
  const cv::Mat pixel(1, 1, CV_8UC3, cv::Scalar(17, 130, 254));
  EXPECT_TRUE(SameImage(resize_antialias(pixel, cv::Size(250, 250)),
                        cv::Mat(250, 250, CV_8UC3, cv::Scalar(17, 130, 254))));
}

// Shrinking and enlarging on each axis, both pass orders, a view with its own
// row step, and a hard edge whose lobes overshoot both ends.
TEST(ResizeAntialiasTest, MatchesTheOnePassTranscriptionInTheOrderThatLeavesFewerPixels) {
  cv::Mat edge(10, 40, CV_8UC3, cv::Scalar(0, 0, 0));
  edge(cv::Rect(20, 0, 20, 10)).setTo(cv::Scalar(255, 255, 255));
  const cv::Mat big = RandomImage(300, 400, 30);
  const struct {
    cv::Mat image;
    cv::Size size;
  } cases[] = {{RandomImage(400, 300, 10), {250, 250}}, {RandomImage(90, 120, 11), {250, 250}},
               {RandomImage(31, 500, 12), {250, 250}},  {RandomImage(250, 250, 13), {40, 100}},
               {big(cv::Rect(17, 9, 201, 230)), {250, 250}}, {edge, {25, 10}}};
  for (const auto& c : cases) {
    const cv::Mat& image = c.image;
    const cv::Size& size = c.size;
    const cv::Mat expected =
        image.cols * size.height < image.rows * size.width
            ? ReferencePass(ReferencePass(image, image.cols, size.height), size.width, size.height)
            : ReferencePass(ReferencePass(image, size.width, image.rows), size.width, size.height);
    const cv::Mat out = resize_antialias(image, size);
    EXPECT_TRUE(out.isContinuous());
    EXPECT_TRUE(SameImage(out, expected)) << image.rows << "x" << image.cols;
  }
  const cv::Mat out = resize_antialias(edge, cv::Size(25, 10));
  EXPECT_EQ(out.at<cv::Vec3b>(5, 0), cv::Vec3b(0, 0, 0));
  EXPECT_EQ(out.at<cv::Vec3b>(5, 24), cv::Vec3b(255, 255, 255));
}

TEST(ResizeAntialiasTest, ErrorsAreWrittenAndNotThrown) {
  const cv::Mat grey(10, 10, CV_8UC1, cv::Scalar(5));
  testing::internal::CaptureStderr();
  const cv::Mat out = resize_antialias(grey, cv::Size(20, 20));
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "Error: resize_antialias type\n");
  EXPECT_EQ(out.data, grey.data);
  testing::internal::CaptureStderr();
  EXPECT_TRUE(resize_antialias_oracle(RandomImage(10, 12, 40), 20, 20).empty());
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "Error: resize_antialias_oracle size\n");
}

}  // namespace
}  // namespace tavilib
