#ifndef TAVI_SRC_ALIGNMENT_ALIGNMENT_FRAME_H_
#define TAVI_SRC_ALIGNMENT_ALIGNMENT_FRAME_H_

#include <opencv2/core.hpp>

#include <vector>

#include "tavilib.h"

namespace tavilib {

// A face as the regression receives it: the grey 250 by 250 working frame cut
// from the image around the rectangle, the enlarged face box in that frame,
// and what maps frame pixels back to image pixels. align68Points and the
// landmark trainer both make it here, so that they see the same numbers.
struct AlignmentFrame {
  // 8-bit single-channel.
  cv::Mat grey;
  // The face box the regression's unit coordinates refer to.
  cv::Rect faceRect;
  // Frame pixels per image pixel, and the crop's unrounded offset in the
  // image.
  float scaleX = 1.0f;
  float scaleY = 1.0f;
  float cropX = 0.0f;
  float cropY = 0.0f;
};

// Crops the image to the rectangle and half of it on each side when the
// rectangle is small against the image, resizes the crop to 250 by 250 (the
// aspect ratio is not kept), converts it to grey and enlarges the rectangle
// into the face box: a fifth wider, moved left by a twentieth of its width,
// and moved down by 0.15 of its height.
// REQUIRES: image is 8-bit 3-channel; the rectangle's crop region lies in it.
AlignmentFrame makeAlignmentFrame(const cv::Mat& image, const Rectangle<float>& rect);

// Frame pixels of a shape (x0, y0, x1, y1, ...) to image pixels.
std::vector<float> frameToImage(const AlignmentFrame& frame, const std::vector<float>& shape);

}  // namespace tavilib

#endif  // TAVI_SRC_ALIGNMENT_ALIGNMENT_FRAME_H_
