#include "detector/window_grading.h"

#include <opencv2/imgproc.hpp>

#include <algorithm>
#include <cstdint>
#include <vector>

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

// Windows a grading net takes in one pass where that many are left: its
// inner products then read their weights once for all of them.
constexpr int kWindowBatch = 8;

// The stage's net for kWindowBatch windows, made at first use; null where its
// "probs" are not one value a class of at least two classes, which the
// normalisation below needs.
nn::Net<float>* batchNet(CascadeStage& stage) {
  if (!stage.batchNet) {
    const nn::Blob<float>& probs = *stage.net->output_blob();
    if (stage.net->net_input_blobs().size() != 1 || probs.height() * probs.width() != 1 ||
        probs.channels() < 2) {
      return nullptr;
    }
    stage.batchNet = stage.net->WithBatch(kWindowBatch);
  }
  return stage.batchNet.get();
}

// Image k's class probabilities. The softmax normalises the first image only;
// a later one holds exp(logit - its largest logit), normalised here in the
// softmax's own order of operations.
void classProbabilities(const nn::Blob<float>& probs, int k, std::vector<float>& out) {
  const int classes = probs.count() / std::max(probs.num(), 1);
  const float* values = probs.cpu_data() + k * classes;
  out.assign(values, values + classes);
  if (k == 0) return;
  float sum = values[0] + values[1];
  for (int c = 2; c < classes; ++c) sum = values[c] + sum;
  for (int c = 0; c < classes; ++c) out[c] = values[c] / sum;
}

// Cuts each window out, resizes it to the net's input, subtracts the stage's
// mean and runs the net, kWindowBatch windows a pass while that many are
// left; use receives each window's index and class probabilities.
template <typename Use>
void runOnWindows(const std::vector<Window>& windows, CascadeStage& stage, const cv::Mat& image,
                  Use use) {
  nn::Net<float>* batch = batchNet(stage);
  std::vector<float> probabilities;
  for (size_t first = 0; first < windows.size();) {
    const bool together = batch != nullptr && windows.size() - first >= kWindowBatch;
    nn::Net<float>& net = together ? *batch : *stage.net;
    const int count = together ? kWindowBatch : 1;
    nn::Blob<float>* input = net.net_input_blobs()[0];
    const int perImage = input->count() / input->num();
    // A mean shorter than the input (an incomplete mean file) covers only its
    // own length.
    const int meanCount = std::min(perImage, static_cast<int>(stage.mean.size()));
    for (int k = 0; k < count; ++k) {
      float* planes = input->mutable_cpu_data() + k * perImage;
      writeImagePlanes(cutWindow(image, windows[first + k], input->width(), input->height()),
                       planes, perImage);
      nn::vsSub(meanCount, planes, stage.mean.data(), planes);
    }
    net.Forward();
    for (int k = 0; k < count; ++k) {
      classProbabilities(*net.output_blob(), k, probabilities);
      use(first + k, probabilities);
    }
    first += count;
  }
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
  runOnWindows(windows, stage, image, [&windows](size_t i, const std::vector<float>& probabilities) {
    windows[i].score = probabilities[1];
  });
  return windows;
}

std::vector<Window> calibrateWindows(std::vector<Window> windows, CascadeStage& calibration,
                                     const cv::Mat& image) {
  const nn::Blob<float>& probs = *calibration.net->output_blob();
  // Only classes that both the table and the net have are looked at.
  const int classes = std::min(static_cast<int>(calibration.offsetsScales.size()),
                               probs.count() / std::max(probs.num(), 1));
  const nn::Blob<float>& input = *calibration.net->net_input_blobs()[0];
  const float inputWidth = static_cast<float>(input.width());
  const float inputHeight = static_cast<float>(input.height());
  if (classes == 0) {
    return windows;
  }
  runOnWindows(windows, calibration, image, [&](size_t i, const std::vector<float>& probabilities) {
    Window& window = windows[i];
    // On a tie the lowest class wins; probabilities are never negative.
    const int best = static_cast<int>(cblas_isamax(classes, probabilities.data(), 1));
    if (kCalibrationConfidence > probabilities[best]) {
      return;
    }
    const OffsetScale& correction = calibration.offsetsScales[best];
    // A negative offset moves the window right or down; a scale below 1
    // enlarges it. Values are truncated as the detector always did; one
    // that no 32-bit integer holds (a scale of 0, an offset near 2^31)
    // cannot land inside the image, and the window stays.
    if (correction.scale == 0.0f) {
      return;
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
      return;
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
  });
  return windows;
}

}  // namespace tavilib
