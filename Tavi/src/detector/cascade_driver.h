#ifndef TAVI_SRC_DETECTOR_CASCADE_DRIVER_H_
#define TAVI_SRC_DETECTOR_CASCADE_DRIVER_H_

#include <opencv2/core.hpp>

#include <functional>
#include <vector>

#include "detector/detector_state.h"
#include "detector/window.h"
#include "tavilib.h"

namespace tavilib {

// The windows born in the pyramid scan, in the frame of the base image, and
// the factor from the input image to that frame.
struct PyramidScan {
  std::vector<Window> windows;
  float baseScale;
};

// The network work of the cascade, separated from the driver's order of steps
// so that the order can be exercised on hand-made window lists.
struct CascadeSteps {
  // Scans the image pyramid with the first stage's net.
  std::function<PyramidScan(const cv::Mat& image, const CascadeParameter& params,
                            CascadeStage& firstStage)>
      scan;
  // Replaces each window's score by the stage net's face probability.
  std::function<std::vector<Window>(std::vector<Window> windows, CascadeStage& stage,
                                    const cv::Mat& image)>
      grade;
  // Moves and resizes windows by the calibration net's class.
  std::function<std::vector<Window>(std::vector<Window> windows, CascadeStage& calibration,
                                    const cv::Mat& image)>
      calibrate;
};

// The body of detect: scan, bring windows to the input frame, sort, threshold
// stage 0, then grade each later stage (calibrating and merging per size in
// the stages between the first and the last) before its threshold, and a final
// merge. Appends the survivors to detections, best first.
Status runCascade(const Image& image, DetectorState& state, std::vector<Detection>& detections,
                  const CascadeParameter& params, const CascadeSteps& steps);

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_CASCADE_DRIVER_H_
