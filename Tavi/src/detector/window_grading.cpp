#include "detector/window_grading.h"

#include <opencv2/imgproc.hpp>

#include <algorithm>

#include "detector/image_planes.h"
#include "nn/net.h"
#include "nn/util/math_functions.h"

namespace tavilib {

namespace {

// A class must claim at least this probability to move a window.
constexpr float kCalibrationConfidence = 0.1f;

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
    // enlarges it.
    const int32_t x = window.x - static_cast<int32_t>(static_cast<float>(correction.offsetX) /
                                                      inputWidth *
                                                      static_cast<float>(window.width));
    const int32_t y = window.y - static_cast<int32_t>(static_cast<float>(correction.offsetY) /
                                                      inputHeight *
                                                      static_cast<float>(window.height));
    const int32_t width =
        static_cast<int32_t>(static_cast<float>(window.width) / correction.scale);
    const int32_t height =
        static_cast<int32_t>(static_cast<float>(window.height) / correction.scale);
    // Strictly inside, or not at all: there is no clipping.
    if (x >= 0 && y >= 0 && x < image.cols - width && y < image.rows - height) {
      window.x = x;
      window.y = y;
      window.width = width;
      window.height = height;
    }
  }
  return windows;
}

}  // namespace tavilib
