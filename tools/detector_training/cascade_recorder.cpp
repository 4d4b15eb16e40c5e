#include "detector_training/cascade_recorder.h"

#include "detector/cascade_driver.h"
#include "detector/pyramid_scan.h"
#include "detector/window_grading.h"

namespace training {

std::vector<tavilib::Window> windowsForNextStage(tavilib::DetectorState& soFar,
                                                 const cv::Mat& image,
                                                 const tavilib::CascadeParameter& settings) {
  // A stand-in for the untrained stage; its grading records what it is given.
  soFar.stages.push_back(tavilib::CascadeStage());
  const tavilib::CascadeStage* recorder = &soFar.stages.back();
  std::vector<tavilib::Window> recorded;
  tavilib::CascadeSteps steps;
  steps.scan = tavilib::scanPyramid;
  steps.calibrate = tavilib::calibrateWindows;
  steps.grade = [&](std::vector<tavilib::Window> windows, tavilib::CascadeStage& stage,
                    const cv::Mat& input) {
    if (&stage != recorder) {
      return tavilib::gradeWindows(std::move(windows), stage, input);
    }
    recorded = windows;
    return windows;
  };
  const bool wasReady = soFar.ready;
  soFar.ready = true;
  tavilib::Image wrapped{image.cols, image.rows, static_cast<int>(image.step), image.data};
  std::vector<tavilib::Detection> unused;
  tavilib::runCascade(wrapped, soFar, unused, settings, steps);
  soFar.ready = wasReady;
  soFar.stages.pop_back();
  return recorded;
}

}  // namespace training
