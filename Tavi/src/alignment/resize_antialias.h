#ifndef TAVI_SRC_ALIGNMENT_RESIZE_ANTIALIAS_H_
#define TAVI_SRC_ALIGNMENT_RESIZE_ANTIALIAS_H_

#include <opencv2/core.hpp>

namespace tavilib {

// The Lanczos kernel with three lobes: sinc(x) * sinc(x / 3) on -3 <= x < 3,
// 0 elsewhere, in single precision.
float lanczos3(float x);

// Resizes an 8-bit three-channel image (a view is fine) to size by two
// one-axis passes, the one that leaves fewer pixels first. Shrinking widens
// the kernel by the scale factor. On another type, writes
// "Error: resize_antialias type" to standard error and returns src itself.
cv::Mat resize_antialias(const cv::Mat& src, cv::Size size);

// One pass along one axis of an 8-bit three-channel image: a horizontal pass when src has height rows (also
// when nothing changes), a vertical one when only the rows differ. If both
// sizes differ, writes "Error: resize_antialias_oracle size" to standard error
// and returns an empty matrix. The result is fresh and continuous.
cv::Mat resize_antialias_oracle(const cv::Mat& src, int width, int height);

}  // namespace tavilib

#endif  // TAVI_SRC_ALIGNMENT_RESIZE_ANTIALIAS_H_
