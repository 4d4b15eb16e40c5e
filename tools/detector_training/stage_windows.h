#ifndef TOOLS_DETECTOR_TRAINING_STAGE_WINDOWS_H_
#define TOOLS_DETECTOR_TRAINING_STAGE_WINDOWS_H_

#include <vector>

#include "detector/detector_state.h"
#include "detector_training/training_data.h"
#include "detector_training/window_sampler.h"
#include "detector_training/window_set.h"

namespace training {

// How one stage's windows are drawn.
struct StageRecipe {
  int side;
  // Positives drawn per face and per crop in each epoch, and how far they
  // stray from the face box.
  int positivesPerFace;
  Jitter jitter;
  // Random windows per negative image, and part faces per face image.
  int randomNegativesPerImage;
  int partFacesPerImage;
  // Windows the cascade so far hands on, kept per image: from negative
  // images (all negatives), and from face images (IoU at least
  // minPositiveIoU with the face: positives; overlapping it with IoU below
  // 0.3: negatives). 0 for the first stage, which has no cascade before it.
  int minedPerNegativeImage;
  int minedPerFaceImage;
  float minPositiveIoU;
};

// Positives for one epoch: faces and crops moved within the recipe's jitter,
// with random appearance changes.
WindowSet drawPositives(const DetectorData& data, const StageRecipe& recipe, WindowSampler& sampler);

// Windows for the calibration net: each face moved and resized by the
// inverse of a random class of the table, labelled with that class.
WindowSet drawCalibrationWindows(const DetectorData& data, int perFace,
                                 const std::vector<tavilib::OffsetScale>& table,
                                 WindowSampler& sampler);

// The fixed windows of a stage: random and part-face negatives, and the
// windows that the cascade so far (soFar, empty for the first stage) hands
// on from negative and face images, scanned for faces of minFace pixels
// and up with the scan net's declared input maxBase.
WindowSet drawFixedWindows(const DetectorData& data, const StageRecipe& recipe,
                           tavilib::DetectorState& soFar, int minFace, int maxBase,
                           WindowSampler& sampler);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_STAGE_WINDOWS_H_
