#include "landmark_training/landmark_sample.h"

#include <opencv2/imgproc.hpp>

#include "alignment/alignment_frame.h"
#include "alignment/sdm_regression.h"

namespace landmarks {

namespace {

// Pairs of points that change places in a mirrored face; the others stay.
const int kMirrorPairs[][2] = {
    {0, 16},  {1, 15},  {2, 14},  {3, 13},  {4, 12},  {5, 11},  {6, 10},  {7, 9},
    {17, 26}, {18, 25}, {19, 24}, {20, 23}, {21, 22}, {31, 35}, {32, 34}, {36, 45},
    {37, 44}, {38, 43}, {39, 42}, {40, 47}, {41, 46}, {48, 54}, {49, 53}, {50, 52},
    {55, 59}, {56, 58}, {60, 64}, {61, 63}, {65, 67}};

}  // namespace

bool makeSample(const cv::Mat& image, const tavilib::Rectangle<float>& rect,
                const std::vector<float>& points, int faceWidth, LandmarkSample* sample) {
  tavilib::AlignmentFrame frame;
  try {
    frame = tavilib::makeAlignmentFrame(image, rect);
  } catch (const cv::Exception&) {
    return false;
  }
  SDMCore::GeneralUnit unit;
  unit.image = frame.grey;
  unit.faceRect = frame.faceRect;
  // The truth rides along with the image as the unit scales it.
  unit.resultShape.resize(points.size());
  for (size_t k = 0; k + 1 < points.size(); k += 2) {
    unit.resultShape[k] = (points[k] - frame.cropX) * frame.scaleX;
    unit.resultShape[k + 1] = (points[k + 1] - frame.cropY) * frame.scaleY;
  }
  if (unit.faceRect.width <= 0 || unit.faceRect.height <= 0) {
    return false;
  }
  unit.normalize(faceWidth);
  sample->image = unit.image;
  sample->faceRect = unit.faceRect;
  sample->truth = unit.resultShape;
  return true;
}

void mirrorFace(const cv::Mat& image, const std::vector<float>& points, cv::Mat* mirroredImage,
                std::vector<float>* mirroredPoints) {
  cv::flip(image, *mirroredImage, 1);
  std::vector<int> source(points.size() / 2);
  for (size_t k = 0; k < source.size(); ++k) {
    source[k] = static_cast<int>(k);
  }
  for (const auto& pair : kMirrorPairs) {
    source[pair[0]] = pair[1];
    source[pair[1]] = pair[0];
  }
  mirroredPoints->resize(points.size());
  for (size_t k = 0; k < source.size(); ++k) {
    (*mirroredPoints)[2 * k] = static_cast<float>(image.cols - 1) - points[2 * source[k]];
    (*mirroredPoints)[2 * k + 1] = points[2 * source[k] + 1];
  }
}

void rotateFace(const cv::Mat& image, const std::vector<float>& points, double degrees,
                cv::Mat* rotatedImage, std::vector<float>* rotatedPoints) {
  cv::Point2d centre(0.0, 0.0);
  for (size_t k = 0; k + 1 < points.size(); k += 2) {
    centre += cv::Point2d(points[k], points[k + 1]);
  }
  centre *= 2.0 / static_cast<double>(points.size());
  const cv::Mat turn = cv::getRotationMatrix2D(centre, degrees, 1.0);
  cv::warpAffine(image, *rotatedImage, turn, image.size(), cv::INTER_LINEAR, cv::BORDER_REFLECT_101);
  rotatedPoints->resize(points.size());
  for (size_t k = 0; k + 1 < points.size(); k += 2) {
    const double x = points[k];
    const double y = points[k + 1];
    (*rotatedPoints)[k] = static_cast<float>(turn.at<double>(0, 0) * x + turn.at<double>(0, 1) * y +
                                             turn.at<double>(0, 2));
    (*rotatedPoints)[k + 1] = static_cast<float>(turn.at<double>(1, 0) * x +
                                                 turn.at<double>(1, 1) * y + turn.at<double>(1, 2));
  }
}

}  // namespace landmarks
