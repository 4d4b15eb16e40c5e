#include "detector/cascade_driver.h"

#include <cstdint>
#include <stdexcept>
#include <utility>

#include "detector/window_filter.h"

namespace tavilib {

namespace {

cv::Mat wrapImage(const Image& image) {
  if (image.stride < 0 ||
      (image.stride > 0 && image.stride < static_cast<int64_t>(image.width) * 3)) {
    throw std::invalid_argument("detect: the stride must be 0 or at least width * 3 bytes");
  }
  // A stride of 0 is cv::Mat::AUTO_STEP: tightly packed rows.
  return cv::Mat(image.height, image.width, CV_8UC3, image.data,
                 static_cast<size_t>(image.stride));
}

void scaleToInputFrame(std::vector<Window>& windows, float baseScale) {
  const float factor = 1.0f / baseScale;
  for (Window& window : windows) {
    window.x = static_cast<int32_t>(static_cast<float>(window.x) * factor);
    window.y = static_cast<int32_t>(static_cast<float>(window.y) * factor);
    window.width = static_cast<int32_t>(static_cast<float>(window.width) * factor);
    window.height = static_cast<int32_t>(static_cast<float>(window.height) * factor);
  }
}

Detection toDetection(const Window& window) {
  Detection detection;
  detection.box.left = static_cast<float>(window.x);
  detection.box.top = static_cast<float>(window.y);
  detection.box.right = static_cast<float>(window.x + window.width);
  detection.box.bottom = static_cast<float>(window.y + window.height);
  detection.score = window.score;
  return detection;
}

}  // namespace

Status runCascade(const Image& image, DetectorState& state, std::vector<Detection>& detections,
                  const CascadeParameter& params, const CascadeSteps& steps) {
  if (!state.ready) {
    return STATUS_DETECTOR_NOT_READY;
  }
  const cv::Mat input = wrapImage(image);
  const CascadeParameter settings = params;

  PyramidScan scan = steps.scan(input, settings, state.stages[0]);
  std::vector<Window> windows = std::move(scan.windows);
  scaleToInputFrame(windows, scan.baseScale);
  sortByScore(windows);
  // The first stage's windows are neither merged nor calibrated: every window
  // above its threshold is graded by the next stage.
  windows = keepAboveThreshold(windows, state.stages[0].threshold);

  const size_t lastStage = state.stages.size() - 1;
  for (size_t s = 1; s <= lastStage; ++s) {
    CascadeStage& stage = state.stages[s];
    windows = steps.grade(std::move(windows), stage, input);
    if (s != lastStage) {
      // Merged before the stage's own threshold, so a weak window can still
      // suppress a neighbour and then drop out itself; models are tuned to it.
      windows = steps.calibrate(std::move(windows), state.calibration, input);
      windows = mergePerSize(windows);
    }
    windows = keepAboveThreshold(windows, stage.threshold);
  }

  windows = mergeFinal(windows);
  for (const Window& window : windows) {
    detections.push_back(toDetection(window));
  }
  return STATUS_OK;
}

}  // namespace tavilib
