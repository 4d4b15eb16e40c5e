#include "alignment/resize_antialias.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <vector>

#include <opencv2/core.hpp>

namespace tavilib {
namespace {

cv::Mat RandomImage(int rows, int cols, uint64_t seed) {
  cv::Mat image(rows, cols, CV_8UC3);
  cv::RNG(seed).fill(image, cv::RNG::UNIFORM, 0, 256);
  return image;
}

bool SameImage(const cv::Mat& a, const cv::Mat& b) {
  return a.size() == b.size() && a.type() == b.type() && cv::norm(a, b, cv::NORM_INF) == 0;
}

// A grey line of the values, as a row or as a column.
cv::Mat Line(const std::vector<uint8_t>& values, bool column) {
  cv::Mat line(1, static_cast<int>(values.size()), CV_8UC3);
  for (size_t i = 0; i < values.size(); ++i) line.at<cv::Vec3b>(0, static_cast<int>(i)) = cv::Vec3b::all(values[i]);
  return column ? cv::Mat(line.t()) : line;
}

// Worked by hand with L(0.25) = 0.89007, L(0.75) = 0.27019, L(1.25) =
// -0.13287. Enlarging 10, 21 to four samples takes one tap at the ends and
// two between: (10 L(0.25) + 21 L(0.75)) / (L(0.25) + L(0.75)) + 0.5 = 13.06
// and its mirror 18.94. Halving four samples takes all four, weighed
// L(-0.25), L(0.25), L(0.75), L(1.25) for the first output and mirrored for
// the second: 240 L(1.25) / sum goes below 0, 255 (2 L(0.25) + L(0.75)) /
// sum above 255, and 240 L(0.25) / sum + 0.5 = 111.9. The kernel's range is
// -3 <= x < 3.
TEST(ResizeAntialiasTest, HandWorkedLinesAlongEitherAxis) {
  EXPECT_EQ(lanczos3(3.0f), 0.0f);
  EXPECT_EQ(lanczos3(std::numeric_limits<float>::quiet_NaN()), 0.0f);
  EXPECT_NE(lanczos3(-3.0f), 0.0f);  // evaluated: sinf's rounding leaves a trace
  EXPECT_NEAR(lanczos3(-3.0f), 0.0f, 1e-6f);
  EXPECT_NEAR(lanczos3(0.25f), 0.89007f, 1e-5f);
  const struct {
    std::vector<uint8_t> in, out;
  } cases[] = {{{10, 21}, {10, 13, 18, 21}}, {{0, 0, 0, 240}, {0, 111}}, {{255, 255, 255, 0}, {255, 137}}};
  for (const auto& c : cases) {
    for (bool column : {false, true}) {
      const int n = static_cast<int>(c.out.size());
      const cv::Mat out = resize_antialias(Line(c.in, column), column ? cv::Size(1, n) : cv::Size(n, 1));
      EXPECT_TRUE(SameImage(out, Line(c.out, column))) << out << " " << column;
    }
  }
}

// The same size and a single pixel spread to 250 by 250 give the input back.
// Otherwise the pass that leaves fewer pixels goes first (the two orders
// round apart); a view with its own row step reads as its copy.
TEST(ResizeAntialiasTest, SameSizeIsTheIdentityAndThePassLeavingFewerPixelsGoesFirst) {
  const cv::Mat image = RandomImage(23, 37, 1);
  EXPECT_TRUE(SameImage(resize_antialias(image, cv::Size(37, 23)), image));
  const cv::Mat pixel(1, 1, CV_8UC3, cv::Scalar(17, 130, 254));
  EXPECT_TRUE(SameImage(resize_antialias(pixel, cv::Size(250, 250)),
                        cv::Mat(250, 250, CV_8UC3, cv::Scalar(17, 130, 254))));
  const cv::Mat big = RandomImage(300, 400, 30);
  for (const cv::Mat& source : {RandomImage(400, 300, 10), RandomImage(31, 500, 12), big(cv::Rect(17, 9, 201, 230))}) {
    const cv::Mat rowsFirst = resize_antialias_oracle(resize_antialias_oracle(source, source.cols, 250), 250, 250);
    const cv::Mat columnsFirst = resize_antialias_oracle(resize_antialias_oracle(source, 250, source.rows), 250, 250);
    const bool fewerRows = source.cols * 250 < source.rows * 250;
    const cv::Mat out = resize_antialias(source, cv::Size(250, 250));
    EXPECT_TRUE(out.isContinuous());
    EXPECT_TRUE(SameImage(out, fewerRows ? rowsFirst : columnsFirst)) << source.size();
    EXPECT_FALSE(SameImage(out, fewerRows ? columnsFirst : rowsFirst)) << source.size();
    EXPECT_TRUE(SameImage(out, resize_antialias(source.clone(), cv::Size(250, 250))));
  }
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
