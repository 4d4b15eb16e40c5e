#include "alignment/resize_antialias.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>
#include <random>
#include <string>
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
  if (a.size() != b.size() || a.type() != b.type()) return false;
  for (int y = 0; y < a.rows; ++y) {
    if (!std::equal(a.ptr<uint8_t>(y), a.ptr<uint8_t>(y) + a.cols * a.elemSize(), b.ptr<uint8_t>(y))) {
      return false;
    }
  }
  return true;
}

// A plain transcription of the one-axis pass, one output sample at a time.
cv::Mat ReferencePass(const cv::Mat& src, int width, int height) {
  const bool horizontal = src.rows == height;
  const int srcLen = horizontal ? src.cols : src.rows;
  const int dstLen = horizontal ? width : height;
  const float ratio = static_cast<float>(srcLen) / static_cast<float>(dstLen);
  const float filterScale = ratio >= 1.0f ? ratio : 1.0f;
  const float support = ratio >= 1.0f ? 3.0f * ratio : 0.5f;
  cv::Mat dst(height, width, CV_8UC3);
  const int lines = horizontal ? src.rows : src.cols;
  for (int i = 0; i < dstLen; ++i) {
    const float centre = (static_cast<float>(i) + 0.5f) * ratio;
    const int first = static_cast<int>(std::max(0.0f, std::floor(centre - support)));
    const int last = static_cast<int>(std::min(static_cast<float>(srcLen), std::ceil(centre + support)));
    std::vector<float> weights;
    float sum = 0.0f;
    for (int j = first; j < last; ++j) {
      weights.push_back(lanczos3((static_cast<float>(j) - centre + 0.5f) * (1.0f / filterScale)) *
                        (1.0f / filterScale));
      sum += weights.back();
    }
    const float norm = sum != 0.0f ? 1.0f / sum : 1.0f;
    for (int other = 0; other < lines; ++other) {
      for (int c = 0; c < 3; ++c) {
        float acc = 0.0f;
        for (int j = first; j < last; ++j) {
          const uint8_t sample = horizontal ? src.at<cv::Vec3b>(other, j)[c] : src.at<cv::Vec3b>(j, other)[c];
          acc += static_cast<float>(sample) * weights[j - first];
        }
        const float v = acc * norm + 0.5f;
        const uint8_t byte = v < 0.5f ? 0 : v >= 255.0f ? 255 : static_cast<uint8_t>(static_cast<int>(v));
        if (horizontal) {
          dst.at<cv::Vec3b>(other, i)[c] = byte;
        } else {
          dst.at<cv::Vec3b>(i, other)[c] = byte;
        }
      }
    }
  }
  return dst;
}

TEST(Lanczos3Test, RangeIsHalfOpen) {
  EXPECT_EQ(lanczos3(0.0f), 1.0f);
  EXPECT_EQ(lanczos3(3.0f), 0.0f);
  EXPECT_EQ(lanczos3(3.5f), 0.0f);
  EXPECT_EQ(lanczos3(-3.5f), 0.0f);
  EXPECT_EQ(lanczos3(std::numeric_limits<float>::quiet_NaN()), 0.0f);
  // -3 is evaluated: near zero, from the rounding of sinf.
  EXPECT_NEAR(lanczos3(-3.0f), 0.0f, 1e-6f);
  EXPECT_NEAR(lanczos3(0.5f), 0.6079271f, 1e-6f);
  EXPECT_EQ(lanczos3(1.25f), lanczos3(-1.25f));
  EXPECT_LT(lanczos3(1.5f), 0.0f);
}

TEST(ResizeAntialiasTest, SameSizeIsTheIdentityAfterRounding) {
  const cv::Mat image = RandomImage(23, 37, 1);
  EXPECT_TRUE(SameImage(resize_antialias(image, cv::Size(37, 23)), image));
  const cv::Mat square = RandomImage(250, 250, 2);
  EXPECT_TRUE(SameImage(resize_antialias(square, cv::Size(250, 250)), square));
}

TEST(ResizeAntialiasTest, OnePixelEnlargedGivesThatPixelEverywhere) {
  cv::Mat pixel(1, 1, CV_8UC3, cv::Scalar(17, 130, 254));
  const cv::Mat out = resize_antialias(pixel, cv::Size(250, 250));
  ASSERT_EQ(out.size(), cv::Size(250, 250));
  for (int y = 0; y < 250; ++y) {
    for (int x = 0; x < 250; ++x) ASSERT_EQ(out.at<cv::Vec3b>(y, x), cv::Vec3b(17, 130, 254));
  }
  // One pixel wide only: every row of the output is its row's pixel.
  const cv::Mat column = RandomImage(250, 1, 3);
  const cv::Mat wide = resize_antialias(column, cv::Size(250, 250));
  for (int y = 0; y < 250; ++y) {
    for (int x = 0; x < 250; ++x) ASSERT_EQ(wide.at<cv::Vec3b>(y, x), column.at<cv::Vec3b>(y, 0));
  }
}

TEST(ResizeAntialiasTest, MatchesThePlainTranscription) {
  const struct {
    int rows, cols, height, width;
  } cases[] = {{400, 300, 250, 250}, {90, 120, 250, 250}, {251, 249, 250, 250},
               {480, 640, 250, 250}, {31, 500, 250, 250}, {250, 250, 100, 40}};
  uint32_t seed = 10;
  for (const auto& c : cases) {
    const cv::Mat image = RandomImage(c.rows, c.cols, seed++);
    const cv::Size size(c.width, c.height);
    cv::Mat expected;
    if (image.cols * size.height < image.rows * size.width) {
      expected = ReferencePass(ReferencePass(image, image.cols, size.height), size.width, size.height);
    } else {
      expected = ReferencePass(ReferencePass(image, size.width, image.rows), size.width, size.height);
    }
    const cv::Mat out = resize_antialias(image, size);
    EXPECT_TRUE(out.isContinuous());
    EXPECT_TRUE(SameImage(out, expected)) << c.rows << "x" << c.cols;
  }
}

TEST(ResizeAntialiasTest, ThePassThatLeavesFewerPixelsGoesFirst) {
  const cv::Mat image = RandomImage(300, 200, 20);
  // 200 * 250 < 300 * 250: rows first.
  const cv::Mat rowsFirst =
      resize_antialias_oracle(resize_antialias_oracle(image, 200, 250), 250, 250);
  const cv::Mat columnsFirst =
      resize_antialias_oracle(resize_antialias_oracle(image, 250, 300), 250, 250);
  ASSERT_FALSE(SameImage(rowsFirst, columnsFirst));
  EXPECT_TRUE(SameImage(resize_antialias(image, cv::Size(250, 250)), rowsFirst));
  const cv::Mat wide = RandomImage(200, 300, 21);
  const cv::Mat expected = resize_antialias_oracle(resize_antialias_oracle(wide, 250, 200), 250, 250);
  EXPECT_TRUE(SameImage(resize_antialias(wide, cv::Size(250, 250)), expected));
}

TEST(ResizeAntialiasTest, ReadsAViewWithItsRowStep) {
  const cv::Mat image = RandomImage(300, 400, 30);
  const cv::Mat view = image(cv::Rect(17, 9, 201, 230));
  ASSERT_FALSE(view.isContinuous());
  EXPECT_TRUE(SameImage(resize_antialias(view, cv::Size(250, 250)),
                        resize_antialias(view.clone(), cv::Size(250, 250))));
}

TEST(ResizeAntialiasTest, NegativeLobesClampToZeroAnd255) {
  // A hard edge: the overshoot on both sides must clamp, not wrap.
  cv::Mat edge(10, 40, CV_8UC3, cv::Scalar(0, 0, 0));
  edge(cv::Rect(20, 0, 20, 10)).setTo(cv::Scalar(255, 255, 255));
  const cv::Mat out = resize_antialias(edge, cv::Size(25, 10));
  EXPECT_TRUE(SameImage(out, ReferencePass(ReferencePass(edge, 25, 10), 25, 10)));
  EXPECT_EQ(out.at<cv::Vec3b>(5, 0), cv::Vec3b(0, 0, 0));
  EXPECT_EQ(out.at<cv::Vec3b>(5, 24), cv::Vec3b(255, 255, 255));
}

TEST(ResizeAntialiasTest, WrongTypeWritesAnErrorAndReturnsTheSource) {
  const cv::Mat grey(10, 10, CV_8UC1, cv::Scalar(5));
  testing::internal::CaptureStderr();
  const cv::Mat out = resize_antialias(grey, cv::Size(20, 20));
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "Error: resize_antialias type\n");
  EXPECT_EQ(out.data, grey.data);
  EXPECT_EQ(out.size(), grey.size());
}

TEST(ResizeAntialiasTest, OnePassWithBothAxesChangedIsRefused) {
  const cv::Mat image = RandomImage(10, 12, 40);
  testing::internal::CaptureStderr();
  const cv::Mat out = resize_antialias_oracle(image, 20, 20);
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "Error: resize_antialias_oracle size\n");
  EXPECT_TRUE(out.empty());
}

TEST(ResizeAntialiasTest, PassOfTheSameSizeIsHorizontalAndTheIdentity) {
  const cv::Mat image = RandomImage(10, 12, 41);
  EXPECT_TRUE(SameImage(resize_antialias_oracle(image, 12, 10), image));
}

}  // namespace
}  // namespace tavilib
