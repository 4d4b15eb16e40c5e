#ifndef TAVI_SRC_DETECTOR_CASCADE_FILES_H_
#define TAVI_SRC_DETECTOR_CASCADE_FILES_H_

#include <string>
#include <vector>

#include "detector/detector_state.h"

namespace tavilib {

// The calibration net's folder below a model folder; a list file can't name
// another.
extern const char kCalibrationFolder[];

// One stage line of a cascade list file.
struct CascadeListEntry {
  std::string folder;
  float threshold;
};

// The stage lines of a list file, in order: a folder name and a threshold per
// line, anything behind them ignored; lines starting with '#' are comments.
// An empty line is a stage with an empty name. A last line that runs into the
// end of the file without a newline is dropped. A file that can't be opened
// has no lines.
std::vector<CascadeListEntry> readCascadeList(const std::string& path);

// The numbers of a mean file, separated by white space. The end of the file
// is tested right after each number, so the file must end in white space or
// its last number is dropped. Reading also stops at a token that is not a
// number. A missing file gives no numbers.
std::vector<float> readMeanFile(const std::string& path);

// Triples of offsetX, offsetY and scale, read until the first triple that
// fails to parse; a last number running into the end of the file counts.
// A missing file gives an empty table.
std::vector<OffsetScale> readOffsetsScales(const std::string& path);

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_CASCADE_FILES_H_
