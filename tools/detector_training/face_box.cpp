#include "detector_training/face_box.h"

#include <algorithm>

namespace training {

namespace {

constexpr int kFirstBrowPoint = 17;
constexpr int kLastBrowPoint = 26;

}  // namespace

cv::Rect2f faceBoxFromPoints(const std::vector<cv::Point2f>& points) {
  float left = points[0].x;
  float right = points[0].x;
  float bottom = points[0].y;
  float top = points[kFirstBrowPoint].y;
  for (size_t i = 0; i < points.size(); ++i) {
    left = std::min(left, points[i].x);
    right = std::max(right, points[i].x);
    bottom = std::max(bottom, points[i].y);
    if (static_cast<int>(i) >= kFirstBrowPoint && static_cast<int>(i) <= kLastBrowPoint) {
      top = std::min(top, points[i].y);
    }
  }
  const float side = std::max(right - left, bottom - top);
  const float centreX = 0.5f * (left + right);
  const float centreY = 0.5f * (top + bottom);
  return cv::Rect2f(centreX - 0.5f * side, centreY - 0.5f * side, side, side);
}

float intersectionOverUnion(const cv::Rect2f& a, const cv::Rect2f& b) {
  const float common = (a & b).area();
  const float all = a.area() + b.area() - common;
  return all > 0.0f ? common / all : 0.0f;
}

}  // namespace training
