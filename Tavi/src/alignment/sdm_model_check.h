#ifndef TAVI_SRC_ALIGNMENT_SDM_MODEL_CHECK_H_
#define TAVI_SRC_ALIGNMENT_SDM_MODEL_CHECK_H_

#include <string>

namespace SDMCore {

enum class SDMCheck {
  // Complete up to its last setting, with stage maps that fit the mean
  // shape, levels the pyramid has and settings in range: alignment stays
  // inside its arrays.
  kSafeToLoad,
  // That, of 68 points, with at least one stage and nothing behind it.
  kUsableFor68Points,
};

// The first fault of the landmark model file at path, as "path: what";
// empty for a sound file. Walks the layout without allocating what its
// counts claim, so a corrupt count costs nothing.
std::string sdmFileFault(const std::string& path, SDMCheck check);

}  // namespace SDMCore

#endif  // TAVI_SRC_ALIGNMENT_SDM_MODEL_CHECK_H_
