#include "detector/image_planes.h"

#include <algorithm>

namespace tavilib {

void writeImagePlanes(const cv::Mat& image, nn::Blob<float>* blob) {
  writeImagePlanes(image, blob->mutable_cpu_data(), blob->count());
}

void writeImagePlanes(const cv::Mat& image, float* planes, int capacity) {
  const int planeSize = image.rows * image.cols;
  const int rows = std::min(image.rows, capacity / std::max(3 * image.cols, 1));
  for (int r = 0; r < rows; ++r) {
    const unsigned char* pixel = image.ptr<unsigned char>(r);
    float* out = planes + r * image.cols;
    for (int c = 0; c < image.cols; ++c, pixel += 3) {
      out[c] = pixel[2];
      out[planeSize + c] = pixel[1];
      out[2 * planeSize + c] = pixel[0];
    }
  }
}

}  // namespace tavilib
