#ifndef TOOLS_LANDMARK_TRAINING_TRAINING_BOXES_H_
#define TOOLS_LANDMARK_TRAINING_TRAINING_BOXES_H_

#include <opencv2/core.hpp>

#include <random>
#include <string>
#include <vector>

#include "tavilib.h"

namespace landmarks {

// How the detector's boxes differ from the face box convention, as fractions
// of the convention box's side: the spread of the centre's offset along x and
// y and of the natural logarithm of the size ratio, and their means.
struct BoxError {
  cv::Point2f meanShift;
  float meanLogScale = 0.0f;
  cv::Point2f shiftSpread;
  float logScaleSpread = 0.0f;
};

// The box a user would pass for each face: the best detection of the
// cascade at cascadeRoot with an IoU of at least 0.5 with the convention box
// (faces of 20 pixels and up), or an empty rectangle where it finds none.
std::vector<tavilib::Rectangle<float>> detectorBoxes(const std::string& cascadeRoot,
                                                     const std::vector<cv::Mat>& images,
                                                     const std::vector<cv::Rect2f>& faces);

// The error of the found boxes (non-empty ones) against the faces.
BoxError measureBoxError(const std::vector<tavilib::Rectangle<float>>& found,
                         const std::vector<cv::Rect2f>& faces);

// The face moved and resized by a random draw of the error.
tavilib::Rectangle<float> jitteredBox(const cv::Rect2f& face, const BoxError& error,
                                      std::mt19937& random);

}  // namespace landmarks

#endif  // TOOLS_LANDMARK_TRAINING_TRAINING_BOXES_H_
