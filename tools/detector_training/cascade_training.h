#ifndef TOOLS_DETECTOR_TRAINING_CASCADE_TRAINING_H_
#define TOOLS_DETECTOR_TRAINING_CASCADE_TRAINING_H_

#include <string>

namespace training {

struct CascadeTrainingOptions {
  // The data folder (with faces68/, lfw68/, faces36/, negatives/, scenes/).
  std::string dataRoot;
  // Snapshots and finished stage folders; a later run resumes from them.
  std::string workFolder;
  // Where the finished model folder goes: cascades/ and cascade.list.
  std::string outputRoot;
  unsigned seed = 1;
  // Uses every shrink-th image and 1/shrink of the epochs, for a trial run.
  int shrink = 1;
  // Threads of the matrix library while a net trains, and of the mining,
  // where each thread runs its own copy of the cascade.
  int threads = 2;
};

// Trains the scan net, the 24-pixel grader, the calibration net and the
// 48-pixel grader in that order, each on the windows that the stages before
// it hand on, and writes the model folder. Prints progress. A stage whose
// folder is in the work folder is kept; a stage in progress resumes from its
// last epoch snapshot. Throws DataError or std::runtime_error on bad data or
// an unwritable folder.
void trainCascade(const CascadeTrainingOptions& options);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_CASCADE_TRAINING_H_
