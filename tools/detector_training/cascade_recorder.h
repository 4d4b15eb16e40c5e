#ifndef TOOLS_DETECTOR_TRAINING_CASCADE_RECORDER_H_
#define TOOLS_DETECTOR_TRAINING_CASCADE_RECORDER_H_

#include <opencv2/core.hpp>

#include <vector>

#include "detector/detector_state.h"
#include "detector/window.h"
#include "tavilib.h"

namespace training {

// The windows that the next stage of a partly trained cascade would grade:
// the detector's own driver runs the stages trained so far (scan, grading,
// calibration and merging where the full cascade has them) and the windows
// are taken where the next stage's net would receive them, in the input
// frame. So every later stage trains on what the cascade really hands it.
//
// soFar holds the trained stages and, once trained, the calibration net;
// calibration applies only where a stage is neither the first nor the last
// of the full cascade, as in the detector.
std::vector<tavilib::Window> windowsForNextStage(tavilib::DetectorState& soFar,
                                                 const cv::Mat& image,
                                                 const tavilib::CascadeParameter& settings);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_CASCADE_RECORDER_H_
