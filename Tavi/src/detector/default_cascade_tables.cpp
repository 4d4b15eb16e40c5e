#include "detector/default_cascade_tables.h"

#include "detector/cascade_net_texts.h"
#include "detector/default_cascade_means.h"

namespace tavilib {

namespace {

constexpr double kEleven12ths = 0.9166666666666666;
constexpr double kThirteen12ths = 1.0833333333333333;

}  // namespace

DefaultCascadeTables::DefaultCascadeTables()
    : thresholds{0.4, 0.8, 0.98},
      stageWeightPaths{"../../../Tavi/public/cascades/x16Net-demo/proto-full",
                       "../../../Tavi/public/cascades/x32Net/proto",
                       "../../../Tavi/public/cascades/x64Net/proto"},
      calibrationWeightPath("../../../Tavi/public/cascades/x32Net-x32-3Scales-200/proto"),
      // Nine shifts by 0 or 4 input pixels at scale 1; the same nine, centred
      // by one pixel, around an enlarged window; one reduced size.
      offsetsX{0, -4, -4, 0, 4, 4, -4, 0, 4, 1, -1, -3, -3, 1, 5, 5, -3, 1, 5},
      offsetsY{0, -4, 0, -4, 0, -4, 4, 4, 4, 1, -1, -3, 1, -3, 1, -3, 5, 5, 5},
      scales{1, 1, 1, 1, 1, 1, 1, 1, 1, kEleven12ths, kThirteen12ths, kEleven12ths, kEleven12ths,
             kEleven12ths, kEleven12ths, kEleven12ths, kEleven12ths, kEleven12ths, kEleven12ths},
      calibrationMean(kCalibrationMean, kCalibrationMean + kCalibrationMeanSize),
      stage1Mean(kStage1Mean, kStage1Mean + kStage1MeanSize),
      stage2Mean(kStage2Mean, kStage2Mean + kStage2MeanSize),
      stage0Mean(kStage0Mean, kStage0Mean + kStage0MeanSize),
      calibrationNetText(kCalibrationNetText),
      stage0NetText(kStage0NetText),
      stage1NetText(kStage1NetText),
      stage2NetText(kStage2NetText) {}

}  // namespace tavilib
