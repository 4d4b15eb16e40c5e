// The public road to the landmarks: the model's lifecycle, the regression of
// a face in its working frame, and the five points.
#include <opencv2/core.hpp>

#include <stdexcept>
#include <string>
#include <vector>

#include "alignment/alignment_frame.h"
#include "alignment/sdm_model.h"
#include "alignment/sdm_model_check.h"
#include "alignment/sdm_regression.h"
#include "tavilib.h"

namespace tavilib {
namespace {

// The 68-point indices averaged into each of the five points, in result order:
// right eye, left eye, nose tip, right and left mouth corner.
const std::vector<std::vector<int>> fivePointGroups = {
    {36, 37, 38, 39, 40, 41}, {42, 43, 44, 45, 46, 47}, {30}, {48}, {54}};

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
  // A file whose sizes would take alignment outside its arrays is refused
  // like a missing one.
  if (!SDMCore::sdmFileFault(path, SDMCore::SDMCheck::kSafeToLoad).empty()) {
    return STATUS_MODEL_LOAD_FAILED;
  }
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
  if (image.width < 1 || image.height < 1 || image.data == nullptr) {
    throw std::invalid_argument("align68Points: an empty image");
  }
  // Rows are taken as tightly packed; stride is not read.
  const cv::Mat pixels(image.height, image.width, CV_8UC3, image.data,
                       static_cast<size_t>(image.width) * 3);
  const AlignmentFrame frame = makeAlignmentFrame(pixels, rect);
  SDMCore::GeneralUnit unit;
  unit.image = frame.grey;
  unit.faceRect = frame.faceRect;
  points = frameToImage(frame, SDMCore::fitFace(unit));
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
