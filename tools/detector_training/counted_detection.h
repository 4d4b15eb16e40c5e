#ifndef TOOLS_DETECTOR_TRAINING_COUNTED_DETECTION_H_
#define TOOLS_DETECTOR_TRAINING_COUNTED_DETECTION_H_

#include <opencv2/core.hpp>

#include <vector>

#include "detector/detector_state.h"
#include "tavilib.h"

namespace training {

// Windows each stage of a cascade took in and let out, summed over calls.
// A stage lets out what the next one grades; the last, what the final merge
// keeps.
struct StageCounts {
  std::vector<double> in;
  std::vector<double> out;
  // Scan scores that are not numbers (the scan's softmax underflowing).
  long nanScores = 0;
};

// detect, through the detector's own driver, counting the windows of each
// stage into counts.
// REQUIRES: state is loaded; settings keep the base image within the scan
//   net's declared input.
std::vector<tavilib::Detection> detectCounting(tavilib::DetectorState& state, const cv::Mat& image,
                                               const tavilib::CascadeParameter& settings,
                                               StageCounts& counts);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_COUNTED_DETECTION_H_
