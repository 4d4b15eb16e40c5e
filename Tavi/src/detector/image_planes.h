#ifndef TAVI_SRC_DETECTOR_IMAGE_PLANES_H_
#define TAVI_SRC_DETECTOR_IMAGE_PLANES_H_

#include <opencv2/core.hpp>

#include "nn/blob.h"

namespace tavilib {

// Writes an 8-bit 3-channel image into a net's input blob as three float
// planes, row-major: first the third byte of every pixel, then the second,
// then the first. No scaling, no mean. Rows that would not fit the blob's
// element count are left out.
void writeImagePlanes(const cv::Mat& image, nn::Blob<float>* blob);
// The same into capacity floats at planes, for one image of a batch.
void writeImagePlanes(const cv::Mat& image, float* planes, int capacity);

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_IMAGE_PLANES_H_
