#ifndef TAVI_SRC_ALIGNMENT_SDM_MODEL_CHECK_H_
#define TAVI_SRC_ALIGNMENT_SDM_MODEL_CHECK_H_

#include <string>

namespace SDMCore {

// The first fault of the landmark model file at path that would make the
// reader fail or the alignment read or write outside its arrays, as
// "path: what"; empty for a sound file. Walks the layout without allocating
// what its counts claim, so a corrupt count costs nothing.
std::string sdmFileFault(const std::string& path);

}  // namespace SDMCore

#endif  // TAVI_SRC_ALIGNMENT_SDM_MODEL_CHECK_H_
