// The crop, the 250 by 250 working frame and the face box of the landmark
// regression, and the way back to image pixels.
#include "alignment/alignment_frame.h"

#include <opencv2/imgproc.hpp>

#include <algorithm>
#include <stdexcept>

#include "alignment/resize_antialias.h"

namespace tavilib {

namespace {

constexpr int kFrameSize = 250;

// value truncated toward zero. A value no int holds comes only from a
// rectangle that is not finite or lies absurdly far out, and is refused
// rather than cast.
int truncatedInt(double value) {
  if (!(value >= -2147483648.0 && value < 2147483648.0)) {
    throw std::invalid_argument("align68Points: the rectangle is not finite or lies too far out");
  }
  return static_cast<int>(value);
}

}  // namespace

AlignmentFrame makeAlignmentFrame(const cv::Mat& image, const Rectangle<float>& rect) {
  cv::Mat work = image;
  float left = rect.left;
  float top = rect.top;
  float right = rect.right;
  float bottom = rect.bottom;
  const float w = right - left;
  const float h = bottom - top;

  // A rectangle small against the image: crop to it and half of it on each
  // side. The offsets stay unrounded although the view starts at their
  // truncated values.
  float cropX = 0.0f;
  float cropY = 0.0f;
  if (static_cast<float>(image.cols / 2) > w || static_cast<float>(image.rows / 2) > h) {
    cropX = std::max(left - w * 0.5f, 0.0f);
    cropY = std::max(top - h * 0.5f, 0.0f);
    float regionRight = right + w * 0.5f;
    if (!(static_cast<float>(image.cols) > regionRight)) {
      regionRight = static_cast<float>(image.cols - 1);
    }
    float regionBottom = bottom + h * 0.5f;
    if (!(static_cast<float>(image.rows) > regionBottom)) {
      regionBottom = static_cast<float>(image.rows - 1);
    }
    const cv::Rect region(truncatedInt(cropX), truncatedInt(cropY),
                          truncatedInt(regionRight - cropX), truncatedInt(regionBottom - cropY));
    // A negative size is the image library's to refuse; an empty one would
    // leave nothing to scale.
    if (region.width == 0 || region.height == 0) {
      throw std::invalid_argument("align68Points: the rectangle leaves no pixels of the image");
    }
    work = work(region);
    left -= cropX;
    right -= cropX;
    top -= cropY;
    bottom -= cropY;
  }

  // The working frame; the aspect ratio is not kept.
  const int columns = work.cols;
  const int rows = work.rows;
  float scaleX = 1.0f;
  float scaleY = 1.0f;
  if (columns != kFrameSize || rows != kFrameSize) {
    work = resize_antialias(work, cv::Size(kFrameSize, kFrameSize));
    scaleX = static_cast<float>(kFrameSize) / static_cast<float>(columns);
    scaleY = static_cast<float>(kFrameSize) / static_cast<float>(rows);
  }
  left *= scaleX;
  right *= scaleX;
  top *= scaleY;
  bottom *= scaleY;

  // The integer face box in the frame. The centred box of an empty rectangle
  // is measured on the size before the resize.
  int boxX;
  int boxY;
  int boxW;
  int boxH;
  if (left >= right) {
    boxW = static_cast<int>(columns * 0.4545454446934474);
    boxH = static_cast<int>(rows * 0.4545454446934474);
    boxX = static_cast<int>((columns - boxW) * 0.5);
    boxY = static_cast<int>((rows - boxH) * 0.5);
  } else {
    boxX = truncatedInt(left);
    boxY = truncatedInt(top);
    boxW = truncatedInt(right - left);
    boxH = truncatedInt(bottom - top);
  }

  // Enlarged asymmetrically: a fifth wider but moved left by a twentieth of
  // the width, and moved down by 0.15 of the height.
  const float a = static_cast<float>(boxW) * 0.1f;
  const float b = static_cast<float>(boxH) * 0.15f;
  AlignmentFrame frame;
  frame.faceRect.x = truncatedInt(static_cast<double>(boxX) - static_cast<double>(a) * 0.5);
  frame.faceRect.y = truncatedInt(static_cast<float>(boxY) + b);
  frame.faceRect.width = truncatedInt(a + a + static_cast<float>(boxW));
  frame.faceRect.height = truncatedInt(b + b + static_cast<float>(boxH));
  // The face is normalised to a width by dividing by this one.
  if (frame.faceRect.width < 1 || frame.faceRect.height < 1) {
    throw std::invalid_argument("align68Points: the rectangle is too small to align");
  }
  // Code 7 (COLOR_RGB2GRAY) weighs the first byte as red, although it holds
  // blue; the models are trained with this.
  cv::cvtColor(work, frame.grey, cv::COLOR_RGB2GRAY, 0);
  frame.scaleX = scaleX;
  frame.scaleY = scaleY;
  frame.cropX = cropX;
  frame.cropY = cropY;
  return frame;

}

std::vector<float> frameToImage(const AlignmentFrame& frame, const std::vector<float>& shape) {
  std::vector<float> points(shape.size());
  for (size_t k = 0; k + 1 < shape.size(); k += 2) {
    points[k] = shape[k] / frame.scaleX + frame.cropX;
    points[k + 1] = shape[k + 1] / frame.scaleY + frame.cropY;
  }
  return points;
}

}  // namespace tavilib
