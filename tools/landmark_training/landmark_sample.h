#ifndef TOOLS_LANDMARK_TRAINING_LANDMARK_SAMPLE_H_
#define TOOLS_LANDMARK_TRAINING_LANDMARK_SAMPLE_H_

#include <opencv2/core.hpp>

#include <vector>

#include "tavilib.h"

namespace landmarks {

// One face as align68Points hands it to the regression, with its true points
// in the same pixels: the grey working frame normalised to the model's face
// width, and the face box in it.
struct LandmarkSample {
  cv::Mat image;
  cv::Rect faceRect;
  std::vector<float> truth;
  // Which person it shows, by number: training keeps a person's faces in one
  // fold.
  size_t person = 0;
};

// Prepares the face at rect of an 8-bit 3-channel image with its 68 true
// points (x0, y0, ... in image pixels) through the library's own working
// frame and normalisation. Returns false when the rectangle's crop does not
// fit the image (align68Points would throw there).
bool makeSample(const cv::Mat& image, const tavilib::Rectangle<float>& rect,
                const std::vector<float>& points, int faceWidth, LandmarkSample* sample);

// The image mirrored left to right with its points: x becomes width - 1 - x
// and the indices of the two sides swap.
void mirrorFace(const cv::Mat& image, const std::vector<float>& points, cv::Mat* mirroredImage,
                std::vector<float>* mirroredPoints);

// The image turned by degrees (counter-clockwise as seen) about the centre
// of its points, with the points; the borders are mirrored in.
void rotateFace(const cv::Mat& image, const std::vector<float>& points, double degrees,
                cv::Mat* rotatedImage, std::vector<float>* rotatedPoints);

}  // namespace landmarks

#endif  // TOOLS_LANDMARK_TRAINING_LANDMARK_SAMPLE_H_
