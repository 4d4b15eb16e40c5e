#ifndef TOOLS_DETECTOR_TRAINING_WINDOW_SAMPLER_H_
#define TOOLS_DETECTOR_TRAINING_WINDOW_SAMPLER_H_

#include <opencv2/core.hpp>

#include <random>
#include <vector>

#include "detector/detector_state.h"

namespace training {

// The square that calibration class correction, applied as the detector
// applies it to a window of a net with netSide input pixels, brings back to
// box.
cv::Rect2f calibrationSquare(const cv::Rect2f& box, const tavilib::OffsetScale& correction,
                             int netSide);

// How far a window may stray from a face box: the largest shift of its
// centre, as a fraction of the box side, and the largest change of its side,
// as a natural logarithm.
struct Jitter {
  float shift;
  float logScale;
};

// Cuts square training windows of side pixels out of images, through the
// library's window preparation, with the appearance changes real photos
// bring: mirroring, grey, blur, brightness and contrast. Parts of a window
// beyond the image are filled by reflection. Deterministic for a seed.
class WindowSampler {
 public:
  WindowSampler(int side, unsigned seed) : side_(side), random_(seed) {}

  // The window at exactly that square (in pixels of the image), with a
  // random appearance unless changeLook is false. Empty when the square
  // misses the image.
  cv::Mat cut(const cv::Mat& image, const cv::Rect2f& window, bool changeLook = true);
  // A window around the face box, moved and resized within the jitter.
  cv::Mat positive(const cv::Mat& image, const cv::Rect2f& box, const Jitter& jitter);
  // A random square of an image without faces: side at least minSide,
  // log-uniform up to the image's shorter edge.
  cv::Mat negative(const cv::Mat& image, int minSide);
  // A window overlapping the face but with an IoU below 0.3 (part faces,
  // badly placed windows), inside the image; empty when none was found.
  cv::Mat partFace(const cv::Mat& image, const cv::Rect2f& box);
  // A window that calibration class k, applied as the detector applies it,
  // brings back to the face box (with a little noise), for the calibration
  // net of the given input side.
  cv::Mat calibrationWindow(const cv::Mat& image, const cv::Rect2f& box,
                            const tavilib::OffsetScale& correction, int netSide);

  std::mt19937& random() { return random_; }
  int side() const { return side_; }

 private:
  float uniform(float low, float high) {
    return std::uniform_real_distribution<float>(low, high)(random_);
  }
  cv::Mat changeAppearance(cv::Mat region, float pixelsPerOutput);

  int side_;
  std::mt19937 random_;
};

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_WINDOW_SAMPLER_H_
