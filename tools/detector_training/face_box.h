#ifndef TOOLS_DETECTOR_TRAINING_FACE_BOX_H_
#define TOOLS_DETECTOR_TRAINING_FACE_BOX_H_

#include <opencv2/core.hpp>

#include <vector>

namespace training {

// The project's face box from 68 landmarks: a square centred on the box that
// spans the points horizontally and from the top of the brows (points 17 to
// 26) down to the lowest point; its side is the larger of that box's width
// and height. Coordinates are pixel centres, as the labels are.
// REQUIRES: 68 points.
cv::Rect2f faceBoxFromPoints(const std::vector<cv::Point2f>& points);

// Intersection over union of two boxes; 0 when either is empty.
float intersectionOverUnion(const cv::Rect2f& a, const cv::Rect2f& b);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_FACE_BOX_H_
