#include "detector/cascade_driver.h"
#include "detector/pyramid_scan.h"
#include "detector/window_grading.h"
#include "tavilib.h"

namespace tavilib {

Status detect(const Image& image, const Detector& detector, std::vector<Detection>& detections,
              const CascadeParameter& params) {
  // detect is const on the Detector, yet it runs (and so changes) its nets.
  auto* state = static_cast<DetectorState*>(const_cast<void*>(detector.getDetector()));
  if (state == nullptr) {
    return STATUS_DETECTOR_NOT_READY;
  }
  static const CascadeSteps networkSteps{scanPyramid, gradeWindows, calibrateWindows};
  return runCascade(image, *state, detections, params, networkSteps);
}

}  // namespace tavilib
