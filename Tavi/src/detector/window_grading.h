#ifndef TAVI_SRC_DETECTOR_WINDOW_GRADING_H_
#define TAVI_SRC_DETECTOR_WINDOW_GRADING_H_

#include <opencv2/core.hpp>

#include <vector>

#include "detector/detector_state.h"
#include "detector/window.h"

namespace tavilib {

// The window cut from the image at full resolution and resized bilinearly to
// width by height (when both are at least 1): what a grading net sees before
// its mean is subtracted. The trainers cut their windows with it too.
// REQUIRES: the window lies inside the image.
cv::Mat cutWindow(const cv::Mat& image, const Window& window, int width, int height);

// Replaces each window's score by the stage net's face probability (class 1
// of "probs") for the window cut from the image at full resolution. Order and
// count are kept.
// REQUIRES: every window lies inside the image.
std::vector<Window> gradeWindows(std::vector<Window> windows, CascadeStage& stage,
                                 const cv::Mat& image);

// Moves and resizes each window by the calibration class the net is surest
// of, if it claims at least one chance in ten and the result stays strictly
// inside the image; otherwise the window stays as it was. Scores and order are
// kept.
// REQUIRES: every window lies inside the image.
std::vector<Window> calibrateWindows(std::vector<Window> windows, CascadeStage& calibration,
                                     const cv::Mat& image);

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_WINDOW_GRADING_H_
