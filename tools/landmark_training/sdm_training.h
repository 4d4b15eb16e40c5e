#ifndef TOOLS_LANDMARK_TRAINING_SDM_TRAINING_H_
#define TOOLS_LANDMARK_TRAINING_SDM_TRAINING_H_

#include <functional>
#include <vector>

#include "alignment/sdm_model.h"
#include "landmark_training/landmark_sample.h"
#include "mp/pca_map.h"

namespace landmarks {

struct SdmSettings {
  std::vector<int32_t> stageLevels{2, 2, 1, 1, 0};
  int32_t scalesPerOctave = 3;
  int32_t faceWidth = 100;
  // Ridge strength per training shape: the normal equations get ridge times
  // the number of shapes on their diagonal.
  double ridge = 1e-2;
  // Shapes move on to the next stage as a stage fit without their person
  // would move them (samples split by person into this many folds), so
  // that later stages learn from the errors unseen faces will show rather
  // than from the smaller ones of faces the stage was fit on. 1: by the
  // stage itself.
  int folds = 1;
};

// Mean error of shapes against their samples' truth after a stage, in units
// of the distance between the outer eye corners (points 36 and 45).
using StageReport = std::function<void(int stage, double trainingError)>;

// A ridge regression from centred feature rows to the displacement still to
// go: projection = (Xc' Xc + ridge * rows * I)^-1 Xc' Y and bias = mean(Y),
// solved in double precision by LAPACK. features is rows by columns,
// targets rows by outputs, both row-major, rows split into folds ending at
// foldEnds (the last being the number of rows); the map's mean gets the
// feature means. Features are centred in place. Returns each row's step as
// the same regression fit without the row's fold would give it, or, with
// one fold, as the map and bias give it.
std::vector<float> fitStage(std::vector<float>& features, const std::vector<float>& targets,
                            const std::vector<size_t>& foldEnds, size_t columns, size_t outputs,
                            double ridge, mp::pca_map* map, mp::matrix* bias);

// Supervised descent on the samples: the mean shape of their truth in units
// of their face boxes, then per stage the nine starts of every sample (as
// the regression places them), their features through the library's own
// FaceFeatures, a ridge regression to the truth, and every shape moved by
// it (or by its fit without the sample's fold) before the next stage
// learns. Calls report after each stage.
SDMCore::SDMModel trainSdm(const std::vector<LandmarkSample>& samples, const SdmSettings& settings,
                           const StageReport& report);

// Error of a shape against the truth over the distance between points 36
// and 45 of the truth, averaged over the 68 points.
double normalisedError(const std::vector<float>& shape, const std::vector<float>& truth);

}  // namespace landmarks

#endif  // TOOLS_LANDMARK_TRAINING_SDM_TRAINING_H_
