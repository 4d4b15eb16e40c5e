#include "detector/window_grading.h"

#include <opencv2/imgproc.hpp>

#include <algorithm>
#include <cstdint>

#include "detector/image_planes.h"
#include "nn/net.h"
#include "nn/util/math_functions.h"

namespace tavilib {

namespace {

// A class must claim at least this probability to move a window.
constexpr float kCalibrationConfidence = 0.1f;

// value truncated toward zero into result, if a 32-bit integer holds it.
bool truncated(float value, int64_t& result) {
  if (!(value >= -2147483648.0f && value < 2147483648.0f)) {
    return false;
  }
  result = static_cast<int64_t>(value);
  return true;
}

// Cuts the window out, resizes it to the net's input, subtracts the stage's
// mean and runs the net.
void runOnWindow(const Window& window, CascadeStage& stage, const cv::Mat& image) {
  nn::Blob<float>* input = stage.net->net_input_blobs()[0];
  writeImagePlanes(cutWindow(image, window, input->width(), input->height()), input);
  float* data = input->mutable_cpu_data();
  // A mean shorter than the input (an incomplete mean file) covers only its
  // own length.
  const int meanCount = std::min(input->count(), static_cast<int>(stage.mean.size()));
  nn::vsSub(meanCount, data, stage.mean.data(), data);
  stage.net->Forward();
}

}  // namespace

cv::Mat cutWindow(const cv::Mat& image, const Window& window, int width, int height) {
  // The view raises the image library's exception for a window that leaves
  // the image.
  const cv::Mat view = image(cv::Rect(window.x, window.y, window.width, window.height));
  if (width < 1 || height < 1) {
    return view;
  }
  cv::Mat sized;
  cv::resize(view, sized, cv::Size(width, height), 0, 0, cv::INTER_LINEAR);
  return sized;
}

std::vector<Window> gradeWindows(std::vector<Window> windows, CascadeStage& stage,
                                 const cv::Mat& image) {
  for (Window& window : windows) {
    runOnWindow(window, stage, image);
    window.score = stage.net->output_blob()->cpu_data()[1];
  }
  return windows;
}

std::vector<Window> calibrateWindows(std::vector<Window> windows, CascadeStage& calibration,
                                     const cv::Mat& image) {
  const boost::shared_ptr<nn::Blob<float>> probs = calibration.net->output_blob();
  const float* probabilities = probs->cpu_data();
  // Only classes that both the table and the net have are looked at.
  const int classes = std::min(static_cast<int>(calibration.offsetsScales.size()),
                               probs->count() / std::max(probs->num(), 1));
  const nn::Blob<float>& input = *calibration.net->net_input_blobs()[0];
  const float inputWidth = static_cast<float>(input.width());
  const float inputHeight = static_cast<float>(input.height());
  if (classes == 0) {
    return windows;
  }
  for (Window& window : windows) {
    runOnWindow(window, calibration, image);
    // On a tie the lowest class wins; probabilities are never negative.
    const int best = static_cast<int>(cblas_isamax(classes, probabilities, 1));
    if (kCalibrationConfidence > probabilities[best]) {
      continue;
    }
    const OffsetScale& correction = calibration.offsetsScales[best];
    // A negative offset moves the window right or down; a scale below 1
    // enlarges it. Values are truncated as the detector always did; one
    // that no 32-bit integer holds (a scale of 0, an offset near 2^31)
    // cannot land inside the image, and the window stays.
    if (correction.scale == 0.0f) {
      continue;
    }
    int64_t shiftX = 0;
    int64_t shiftY = 0;
    int64_t width = 0;
    int64_t height = 0;
    if (!truncated(static_cast<float>(correction.offsetX) / inputWidth *
                       static_cast<float>(window.width), shiftX) ||
        !truncated(static_cast<float>(correction.offsetY) / inputHeight *
                       static_cast<float>(window.height), shiftY) ||
        !truncated(static_cast<float>(window.width) / correction.scale, width) ||
        !truncated(static_cast<float>(window.height) / correction.scale, height)) {
      continue;
    }
    const int64_t x = window.x - shiftX;
    const int64_t y = window.y - shiftY;
    // Strictly inside, or not at all: there is no clipping.
    if (x >= 0 && y >= 0 && x < image.cols - width && y < image.rows - height) {
      window.x = static_cast<int32_t>(x);
      window.y = static_cast<int32_t>(y);
      window.width = static_cast<int32_t>(width);
      window.height = static_cast<int32_t>(height);
    }
  }
  return windows;
}

}  // namespace tavilib
