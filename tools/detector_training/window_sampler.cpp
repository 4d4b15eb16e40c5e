#include "detector_training/window_sampler.h"

#include <opencv2/imgproc.hpp>

#include <algorithm>
#include <cmath>

#include "detector/window_grading.h"
#include "detector_training/face_box.h"

namespace training {

namespace {

// Windows overlapping a face by less than this IoU are part-face negatives.
constexpr float kPartFaceIoU = 0.3f;
constexpr int kPartFaceTries = 30;

}  // namespace

cv::Mat WindowSampler::cut(const cv::Mat& image, const cv::Rect2f& window, bool changeLook) {
  const int side = std::max(1, static_cast<int>(std::lround(window.width)));
  const int x = static_cast<int>(std::lround(window.x));
  const int y = static_cast<int>(std::lround(window.y));
  // A margin keeps blur from seeing the region's edge.
  const int margin = std::max(2, side / 8);
  const cv::Rect wanted(x - margin, y - margin, side + 2 * margin, side + 2 * margin);
  const cv::Rect inside = wanted & cv::Rect(0, 0, image.cols, image.rows);
  if (inside.empty()) {
    return cv::Mat();
  }
  cv::Mat region;
  cv::copyMakeBorder(image(inside), region, inside.y - wanted.y,
                     wanted.br().y - inside.br().y, inside.x - wanted.x,
                     wanted.br().x - inside.br().x, cv::BORDER_REFLECT_101);
  if (changeLook) {
    // The window sits in the middle of the region, so mirroring keeps it
    // there.
    if (uniform(0.0f, 1.0f) < 0.5f) {
      cv::flip(region, region, 1);
    }
    region = changeAppearance(region, static_cast<float>(side) / static_cast<float>(side_));
  }
  return tavilib::cutWindow(region, tavilib::Window{margin, margin, side, side, 0.0f, 0},
                            side_, side_);
}

cv::Mat WindowSampler::changeAppearance(cv::Mat region, float pixelsPerOutput) {
  if (uniform(0.0f, 1.0f) < 0.2f) {
    cv::cvtColor(region, region, cv::COLOR_BGR2GRAY);
    cv::cvtColor(region, region, cv::COLOR_GRAY2BGR);
  }
  if (uniform(0.0f, 1.0f) < 0.2f) {
    const double sigma = uniform(0.2f, 0.8f) * pixelsPerOutput;
    cv::GaussianBlur(region, region, cv::Size(), sigma);
  }
  if (uniform(0.0f, 1.0f) < 0.7f) {
    region.convertTo(region, -1, uniform(0.6f, 1.4f), uniform(-40.0f, 40.0f));
  }
  return region;
}

cv::Mat WindowSampler::positive(const cv::Mat& image, const cv::Rect2f& box,
                                const Jitter& jitter) {
  const float side = box.width * std::exp(uniform(-jitter.logScale, jitter.logScale));
  const float centreX = box.x + 0.5f * box.width + uniform(-jitter.shift, jitter.shift) * box.width;
  const float centreY =
      box.y + 0.5f * box.height + uniform(-jitter.shift, jitter.shift) * box.height;
  return cut(image, cv::Rect2f(centreX - 0.5f * side, centreY - 0.5f * side, side, side));
}

cv::Mat WindowSampler::negative(const cv::Mat& image, int minSide) {
  const float longest = static_cast<float>(std::min(image.cols, image.rows));
  const float shortest = std::min(static_cast<float>(minSide), longest);
  const float side = std::exp(uniform(std::log(shortest), std::log(longest)));
  const float x = uniform(0.0f, static_cast<float>(image.cols) - side);
  const float y = uniform(0.0f, static_cast<float>(image.rows) - side);
  return cut(image, cv::Rect2f(std::floor(x), std::floor(y), std::floor(side), std::floor(side)));
}

cv::Mat WindowSampler::partFace(const cv::Mat& image, const cv::Rect2f& box) {
  for (int attempt = 0; attempt < kPartFaceTries; ++attempt) {
    const float side = std::floor(box.width * std::exp(uniform(-0.6f, 0.6f)));
    const float x = std::floor(box.x + 0.5f * (box.width - side) + uniform(-0.9f, 0.9f) * box.width);
    const float y =
        std::floor(box.y + 0.5f * (box.height - side) + uniform(-0.9f, 0.9f) * box.height);
    const cv::Rect2f window(x, y, side, side);
    const bool inside = x >= 0.0f && y >= 0.0f && x + side <= static_cast<float>(image.cols) &&
                        y + side <= static_cast<float>(image.rows);
    if (inside && side >= 1.0f && (window & box).area() > 0.0f &&
        intersectionOverUnion(window, box) < kPartFaceIoU) {
      return cut(image, window);
    }
  }
  return cv::Mat();
}

cv::Rect2f calibrationSquare(const cv::Rect2f& box, const tavilib::OffsetScale& correction,
                             int netSide) {
  // The inverse of the detector's correction: it moves a window by minus the
  // offset (in net pixels) and divides its side by the scale.
  const float side = box.width * correction.scale;
  const float net = static_cast<float>(netSide);
  return cv::Rect2f(box.x + static_cast<float>(correction.offsetX) / net * side,
                    box.y + static_cast<float>(correction.offsetY) / net * side, side, side);
}

cv::Mat WindowSampler::calibrationWindow(const cv::Mat& image, const cv::Rect2f& box,
                                         const tavilib::OffsetScale& correction, int netSide) {
  // A little noise, so that the net learns classes of nearby boxes, not of
  // exact ones.
  const float side = box.width * std::exp(uniform(-0.03f, 0.03f));
  const cv::Rect2f noisy(box.x + uniform(-0.03f, 0.03f) * box.width,
                         box.y + uniform(-0.03f, 0.03f) * box.height, side, side);
  return cut(image, calibrationSquare(noisy, correction, netSide));
}

}  // namespace training
