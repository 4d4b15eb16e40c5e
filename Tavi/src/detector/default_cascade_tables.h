#ifndef TAVI_SRC_DETECTOR_DEFAULT_CASCADE_TABLES_H_
#define TAVI_SRC_DETECTOR_DEFAULT_CASCADE_TABLES_H_

#include <array>
#include <cstdint>
#include <string>
#include <vector>

namespace tavilib {

// The built-in cascade: thresholds, weight file paths, the calibration table,
// mean images and network descriptions. Only the weights come from files, at
// paths relative to the working directory. The object lives for the length
// of a load; the mean tables are vectors so that it stays small on the stack.
struct DefaultCascadeTables {
  DefaultCascadeTables();

  // Of stages 0, 1 and 2.
  std::array<double, 3> thresholds;
  std::array<std::string, 3> stageWeightPaths;
  std::string calibrationWeightPath;
  // The calibration table; row i is class i of the calibration net.
  std::array<int32_t, 19> offsetsX;
  std::array<int32_t, 19> offsetsY;
  std::array<double, 19> scales;
  std::vector<double> calibrationMean;
  std::vector<double> stage1Mean;
  std::vector<double> stage2Mean;
  // Converted with the others, used by no stage: the first stage has no mean.
  std::vector<double> stage0Mean;
  std::string calibrationNetText;
  std::string stage0NetText;
  std::string stage1NetText;
  std::string stage2NetText;
};

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_DEFAULT_CASCADE_TABLES_H_
