#ifndef TOOLS_TAVI_FACE_FINDER_H_
#define TOOLS_TAVI_FACE_FINDER_H_

#include <string>

#include "tavi/face_report.h"
#include "tavi/image_inputs.h"
#include "tavilib.h"

namespace tavi {

struct FinderSettings {
  std::string models;  // model folder, ending in a separator
  int minFace = 40;
  int landmarks = 0;  // 0, 5 or 68
  std::string drawFolder;  // empty: no annotated copies
};

// One worker's detector. The landmark model is the process's own and must be
// loaded before, with the model checked beforehand.
class FaceFinder {
 public:
  // Loads the cascade of settings.models; throws std::runtime_error if it
  // does not load.
  explicit FaceFinder(const FinderSettings& settings);

  // Decodes the file (grey and alpha images become three-byte pixels), finds
  // its faces and their landmarks, and writes the annotated copy. A file that
  // cannot be read, decoded or drawn gives a report with its error.
  ImageReport process(const ImageInput& input);

 private:
  FinderSettings settings_;
  tavilib::Detector detector_;
};

}  // namespace tavi

#endif  // TOOLS_TAVI_FACE_FINDER_H_
