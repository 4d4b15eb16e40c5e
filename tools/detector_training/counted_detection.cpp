#include "detector_training/counted_detection.h"

#include <cmath>

#include "detector/cascade_driver.h"
#include "detector/pyramid_scan.h"
#include "detector/window_grading.h"

namespace training {

std::vector<tavilib::Detection> detectCounting(tavilib::DetectorState& state, const cv::Mat& image,
                                               const tavilib::CascadeParameter& settings,
                                               StageCounts& counts) {
  const size_t stages = state.stages.size();
  counts.in.resize(stages, 0.0);
  counts.out.resize(stages, 0.0);
  tavilib::CascadeSteps steps;
  steps.scan = [&](const cv::Mat& input, const tavilib::CascadeParameter& params,
                   tavilib::CascadeStage& first) {
    tavilib::PyramidScan scan = tavilib::scanPyramid(input, params, first);
    counts.in[0] += static_cast<double>(scan.windows.size());
    for (const tavilib::Window& window : scan.windows) {
      counts.nanScores += std::isnan(window.score);
    }
    return scan;
  };
  steps.grade = [&](std::vector<tavilib::Window> windows, tavilib::CascadeStage& stage,
                    const cv::Mat& input) {
    const size_t s = static_cast<size_t>(&stage - state.stages.data());
    counts.in[s] += static_cast<double>(windows.size());
    counts.out[s - 1] += static_cast<double>(windows.size());
    return tavilib::gradeWindows(std::move(windows), stage, input);
  };
  steps.calibrate = tavilib::calibrateWindows;
  tavilib::Image wrapped{image.cols, image.rows, static_cast<int>(image.step), image.data};
  std::vector<tavilib::Detection> detections;
  tavilib::runCascade(wrapped, state, detections, settings, steps);
  counts.out[stages - 1] += static_cast<double>(detections.size());
  return detections;
}

}  // namespace training
