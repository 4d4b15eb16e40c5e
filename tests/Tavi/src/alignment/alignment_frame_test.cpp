#include "alignment/alignment_frame.h"

#include <gtest/gtest.h>

#include <limits>

#include <opencv2/core.hpp>

namespace tavilib {
namespace {

// Rectangles and their frames worked out by hand: whether the rectangle is
// small enough to crop (the halved width rounded down, or the halved height,
// greater than its size), the crop region clipped at the image's edges, the
// resize of the region to 250 by 250, and the face box: truncated to whole
// pixels, a fifth wider, moved left by a twentieth of its width and down by
// 0.15 of its height.
TEST(AlignmentFrameTest, CropScaleAndFaceBoxOfATableOfRectangles) {
  const float inf = std::numeric_limits<float>::infinity();
  const struct {
    int width, height;
    Rectangle<float> rect;
    float cropX, cropY;
    int columns, rows;  // of the region taken to the frame
    cv::Rect face;
  } cases[] = {
      // No crop, not resized: box 60, 70, 129 (not 190 - 60), 129.
      {250, 250, {60.75f, 70.25f, 190.5f, 200}, 0, 0, 250, 250, {53, 89, 154, 167}},
      // 101 / 2 = 50 is not greater than a width of 50, nor 150 than 160.
      {101, 300, {20, 40, 70, 200}, 0, 0, 101, 300, {42, 52, 147, 172}},
      // 50 > 49.5 crops; the region is clipped at the top left.
      {101, 300, {20, 40, 69.5f, 200}, 0, 0, 94, 280, {46, 56, 157, 184}},
      // A height below half crops whatever the width.
      {101, 300, {20, 40, 70, 181}, 0, 0, 95, 251, {45, 60, 157, 182}},
      // Clipped at the bottom right: the region ends at 639 and 479.
      {640, 480, {560, 380, 650, 470}, 515, 335, 124, 144, {80, 101, 217, 202}},
      // The crop offsets stay unrounded; the region's size is truncated.
      {640, 480, {200.5f, 150.5f, 330.75f, 290.75f}, 135.375f, 80.375f, 260, 280, {55, 80, 150, 162}},
      // No width to take: the centred box, 0.4545 of the image before the resize.
      {300, 300, {inf, 0, inf, 300}, 0, 0, 300, 300, {75, 102, 163, 176}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(testing::Message() << c.width << "x" << c.height << " " << c.rect.left);
    // The first byte weighs as red, as the models are trained: 0.299 * 255.
    const cv::Mat image(c.height, c.width, CV_8UC3, cv::Scalar(255, 0, 0));
    const AlignmentFrame frame = makeAlignmentFrame(image, c.rect);
    EXPECT_EQ(frame.faceRect, c.face);
    EXPECT_EQ(frame.cropX, c.cropX);
    EXPECT_EQ(frame.cropY, c.cropY);
    EXPECT_EQ(frame.scaleX, c.columns == 250 ? 1.0f : 250.0f / c.columns);
    EXPECT_EQ(frame.scaleY, c.rows == 250 ? 1.0f : 250.0f / c.rows);
    ASSERT_EQ(frame.grey.size(), cv::Size(250, 250));
    ASSERT_EQ(frame.grey.type(), CV_8UC1);
    EXPECT_EQ(cv::countNonZero(frame.grey != 76), 0);
    // The frame's corners go back to the region's.
    const std::vector<float> corners = frameToImage(frame, {0, 0, 250, 250});
    EXPECT_EQ(corners[0], c.cropX);
    EXPECT_EQ(corners[1], c.cropY);
    EXPECT_NEAR(corners[2], c.cropX + c.columns, 1e-3);
    EXPECT_NEAR(corners[3], c.cropY + c.rows, 1e-3);
  }
}

}  // namespace
}  // namespace tavilib
