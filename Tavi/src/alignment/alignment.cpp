// The public road to the landmarks: the model's lifecycle, the crop and the
// 250 by 250 working frame, the face box, and the way back to image pixels.
#include <algorithm>
#include <string>
#include <vector>

#include <opencv2/core.hpp>
#include <opencv2/imgproc.hpp>

#include "alignment/resize_antialias.h"
#include "alignment/sdm_model.h"
#include "alignment/sdm_regression.h"
#include "tavilib.h"

namespace tavilib {
namespace {

// The 68-point indices averaged into each of the five points, in result order:
// right eye, left eye, nose tip, right and left mouth corner.
const std::vector<std::vector<int>> fivePointGroups = {
    {36, 37, 38, 39, 40, 41}, {42, 43, 44, 45, 46, 47}, {30}, {48}, {54}};

constexpr int kFrameSize = 250;
constexpr int kLandmarkCount = 68;

}  // namespace

Status loadSDMModel(const std::string& folder, const std::string& file) {
  // The earlier model goes first, also when this load then fails.
  if (SDMCore::sdmModel != nullptr) {
    delete SDMCore::sdmModel;
    SDMCore::sdmModel = nullptr;
  }
  SDMCore::sdmModel = new SDMCore::SDMModel();
  const std::string path = folder + "/" + file;
  return SDMCore::readSDMModel(path, *SDMCore::sdmModel) ? STATUS_OK : STATUS_MODEL_LOAD_FAILED;
}

Status unloadSDMModel() {
  if (SDMCore::sdmModel == nullptr) return STATUS_OK;
  delete SDMCore::sdmModel;
  SDMCore::sdmModel = nullptr;
  return STATUS_OK;
}

Status align68Points(const Image& image, const Rectangle<float>& rect, std::vector<float>& points) {
  // Without a model of 68 points (none loaded, or the last load failed) there
  // is nothing to regress with.
  if (SDMCore::sdmModel == nullptr ||
      SDMCore::sdmModel->meanShape.size() != 2 * static_cast<size_t>(kLandmarkCount)) {
    points.clear();
    return STATUS_MODEL_LOAD_FAILED;
  }
  // Rows are taken as tightly packed; stride is not read.
  cv::Mat work(image.height, image.width, CV_8UC3, image.data,
               static_cast<size_t>(image.width) * 3);
  float left = rect.left;
  float top = rect.top;
  float right = rect.right;
  float bottom = rect.bottom;
  const float w = right - left;
  const float h = bottom - top;

  // A rectangle small against the image: crop to it and half of it on each
  // side. The offsets stay unrounded although the view starts at their
  // truncated values.
  float cropX = 0.0f;
  float cropY = 0.0f;
  if (static_cast<float>(image.width / 2) > w || static_cast<float>(image.height / 2) > h) {
    cropX = std::max(left - w * 0.5f, 0.0f);
    cropY = std::max(top - h * 0.5f, 0.0f);
    float regionRight = right + w * 0.5f;
    if (!(static_cast<float>(image.width) > regionRight)) {
      regionRight = static_cast<float>(image.width - 1);
    }
    float regionBottom = bottom + h * 0.5f;
    if (!(static_cast<float>(image.height) > regionBottom)) {
      regionBottom = static_cast<float>(image.height - 1);
    }
    const cv::Rect region(static_cast<int>(cropX), static_cast<int>(cropY),
                          static_cast<int>(regionRight - cropX),
                          static_cast<int>(regionBottom - cropY));
    work = work(region);
    left -= cropX;
    right -= cropX;
    top -= cropY;
    bottom -= cropY;
  }

  // The working frame; the aspect ratio is not kept.
  const int columns = work.cols;
  const int rows = work.rows;
  float scaleX = 1.0f;
  float scaleY = 1.0f;
  if (columns != kFrameSize || rows != kFrameSize) {
    work = resize_antialias(work, cv::Size(kFrameSize, kFrameSize));
    scaleX = static_cast<float>(kFrameSize) / static_cast<float>(columns);
    scaleY = static_cast<float>(kFrameSize) / static_cast<float>(rows);
  }
  left *= scaleX;
  right *= scaleX;
  top *= scaleY;
  bottom *= scaleY;

  // The integer face box in the frame. The centred box of an empty rectangle
  // is measured on the size before the resize.
  int boxX;
  int boxY;
  int boxW;
  int boxH;
  if (left >= right) {
    boxW = static_cast<int>(columns * 0.4545454446934474);
    boxH = static_cast<int>(rows * 0.4545454446934474);
    boxX = static_cast<int>((columns - boxW) * 0.5);
    boxY = static_cast<int>((rows - boxH) * 0.5);
  } else {
    boxX = static_cast<int>(left);
    boxY = static_cast<int>(top);
    boxW = static_cast<int>(right - left);
    boxH = static_cast<int>(bottom - top);
  }

  // Enlarged asymmetrically: a fifth wider but moved left by a twentieth of
  // the width, and moved down by 0.15 of the height.
  const float a = static_cast<float>(boxW) * 0.1f;
  const float b = static_cast<float>(boxH) * 0.15f;
  SDMCore::GeneralUnit unit;
  unit.faceRect.x = static_cast<int>(static_cast<double>(boxX) - static_cast<double>(a) * 0.5);
  unit.faceRect.y = static_cast<int>(static_cast<float>(boxY) + b);
  unit.faceRect.width = static_cast<int>(a + a + static_cast<float>(boxW));
  unit.faceRect.height = static_cast<int>(b + b + static_cast<float>(boxH));
  // Code 7 (COLOR_RGB2GRAY) weighs the first byte as red, although it holds
  // blue; the models are trained with this.
  cv::cvtColor(work, unit.image, cv::COLOR_RGB2GRAY, 0);

  const std::vector<float> shape = SDMCore::fitFace(unit);

  points.resize(2 * kLandmarkCount);
  for (int k = 0; k < kLandmarkCount; ++k) {
    points[2 * k] = shape[2 * k] / scaleX + cropX;
    points[2 * k + 1] = shape[2 * k + 1] / scaleY + cropY;
  }
  return STATUS_OK;
}

Status align5Points(const Image& image, const Rectangle<float>& rect, std::vector<float>& points) {
  std::vector<float> all;
  const Status status = align68Points(image, rect, all);
  if (status != STATUS_OK) {
    points.clear();
    return status;
  }
  float five[10];
  for (size_t g = 0; g < fivePointGroups.size(); ++g) {
    const std::vector<int>& group = fivePointGroups[g];
    float x = 0.0f;
    float y = 0.0f;
    for (int index : group) {
      x += all[2 * index];
      y += all[2 * index + 1];
    }
    five[2 * g] = x / static_cast<float>(group.size());
    five[2 * g + 1] = y / static_cast<float>(group.size());
  }
  points.assign(five, five + 10);
  return STATUS_OK;
}

}  // namespace tavilib
