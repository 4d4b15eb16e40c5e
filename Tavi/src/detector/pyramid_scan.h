#ifndef TAVI_SRC_DETECTOR_PYRAMID_SCAN_H_
#define TAVI_SRC_DETECTOR_PYRAMID_SCAN_H_

#include <opencv2/core.hpp>

#include "detector/cascade_driver.h"
#include "detector/detector_state.h"
#include "tavilib.h"

namespace tavilib {

// The first stage: resizes the image to the base size, runs the primed first
// net once over each pyramid level, and makes a window of every cell of its
// output map (no threshold), in the frame of the base image.
// REQUIRES: the base image fits the first net's declared input.
PyramidScan scanPyramid(const cv::Mat& image, const CascadeParameter& params,
                        CascadeStage& firstStage);

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_PYRAMID_SCAN_H_
