#include "detector/cascade_files.h"

#include <fstream>
#include <sstream>

namespace tavilib {

const char kCalibrationFolder[] = "cascades/x32Net-x32-3Scales-200/";

std::vector<CascadeListEntry> readCascadeList(const std::string& path) {
  std::vector<CascadeListEntry> entries;
  std::ifstream list(path);
  std::string line;
  // The end-of-file test comes before a line is kept: an unterminated last
  // line is dropped.
  while (std::getline(list, line) && !list.eof()) {
    if (!line.empty() && line[0] == '#') {
      continue;
    }
    CascadeListEntry entry{std::string(), 0.0f};
    std::istringstream(line) >> entry.folder >> entry.threshold;
    entries.push_back(entry);
  }
  return entries;
}

std::vector<float> readMeanFile(const std::string& path) {
  std::vector<float> mean;
  std::ifstream file(path);
  float value = 0.0f;
  while (file >> value && !file.eof()) {
    mean.push_back(value);
  }
  return mean;
}

std::vector<OffsetScale> readOffsetsScales(const std::string& path) {
  std::vector<OffsetScale> table;
  std::ifstream file(path);
  OffsetScale row{0, 0, 0.0f};
  while (file >> row.offsetX >> row.offsetY >> row.scale) {
    table.push_back(row);
  }
  return table;
}

}  // namespace tavilib
