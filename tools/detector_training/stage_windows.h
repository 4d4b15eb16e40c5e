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
  // maxNegativeIoU: negatives). 0 for the first stage, which has no cascade
  // before it.
  int minedPerNegativeImage;
  int minedPerFaceImage;
  float minPositiveIoU;
  // Non-face images are mined as they are (1), also mirrored (2), and both
  // again scaled by half a pyramid step (4).
  int miningVariants = 1;
  // A last grader that rejects near misses makes the final merge, which
  // keeps the best-scored of overlapping windows, keep the well-placed one.
  float maxNegativeIoU = 0.3f;
};

// Positives for one epoch: faces and crops moved within the recipe's jitter,
// with random appearance changes.
WindowSet drawPositives(const DetectorData& data, const StageRecipe& recipe, WindowSampler& sampler);

// Windows for the calibration net: each face moved and resized by the
// inverse of a random class of the table, labelled with that class.
WindowSet drawCalibrationWindows(const DetectorData& data, int perFace,
                                 const std::vector<tavilib::OffsetScale>& table,
                                 WindowSampler& sampler);

// How the cascade so far scans images while mining: for faces of minFace
// pixels and up in non-face images and of minFaceInFaceImages and up in face
// images, with the scan net's declared input maxBase.
struct FixedWindowScan {
  int minFace;
  int minFaceInFaceImages;
  int maxBase;
};

// The fixed windows of a stage: random and part-face negatives, and the
// windows that the cascade so far hands on from non-face and face images.
// cascades holds one copy of the cascade so far (no stages for the first
// stage) for each worker thread, since a net serves one thread at a time.
// The result depends on the seed, not on the number of workers.
WindowSet drawFixedWindows(const DetectorData& data, const StageRecipe& recipe,
                           std::vector<tavilib::DetectorState>& cascades,
                           const FixedWindowScan& scan, unsigned seed);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_STAGE_WINDOWS_H_
