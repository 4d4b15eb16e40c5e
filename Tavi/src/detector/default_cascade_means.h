#ifndef TAVI_SRC_DETECTOR_DEFAULT_CASCADE_MEANS_H_
#define TAVI_SRC_DETECTOR_DEFAULT_CASCADE_MEANS_H_

namespace tavilib {

// Mean images of the built-in cascade's nets, plane after plane (plane 0 for
// the third byte of a pixel), each plane row-major. Generated from the mean
// files of a model folder by tools/generate_cascade_means; the generated
// source says which folder.
constexpr int kCalibrationMeanSize = 3 * 24 * 24;
constexpr int kStage0MeanSize = 3 * 12 * 12;
constexpr int kStage1MeanSize = 3 * 24 * 24;
constexpr int kStage2MeanSize = 3 * 48 * 48;

extern const double kCalibrationMean[kCalibrationMeanSize];
extern const double kStage0Mean[kStage0MeanSize];
extern const double kStage1Mean[kStage1MeanSize];
extern const double kStage2Mean[kStage2MeanSize];

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_DEFAULT_CASCADE_MEANS_H_
