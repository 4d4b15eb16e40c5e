#ifndef TOOLS_DETECTOR_TRAINING_MODEL_FOLDER_H_
#define TOOLS_DETECTOR_TRAINING_MODEL_FOLDER_H_

#include <string>
#include <vector>

#include "detector/detector_state.h"
#include "nn/proto/nn.pb.h"

namespace training {

// What one stage folder of a cascade model folder holds.
struct StageFiles {
  // The full form (the scan net: "prototxt-full", "proto-full") or the
  // deploy form ("prototxt-deploy", "proto").
  bool fullForm = false;
  nn::NetParameter description;
  nn::NetParameter weights;
  // Written as "mean" (six significant digits, as the built-in tables keep
  // them, so that both loads subtract the same floats).
  std::vector<float> mean;
  // Written as "offsets-scales" when not empty.
  std::vector<tavilib::OffsetScale> offsetsScales;
};

// Writes the stage into folder: first into folder + ".tmp", then renamed, so
// that a folder is either complete or absent, and a good one is never
// replaced by half a new one. Throws std::runtime_error when a file can't be
// written.
void writeStageFolder(const std::string& folder, const StageFiles& files);

// Copies a complete stage folder over another, the same way.
void copyStageFolder(const std::string& from, const std::string& to);

// Writes a text file through a temporary name and a rename.
void writeFileAtomically(const std::string& path, const std::string& contents);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_MODEL_FOLDER_H_
