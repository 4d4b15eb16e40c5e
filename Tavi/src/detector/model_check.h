#ifndef TAVI_SRC_DETECTOR_MODEL_CHECK_H_
#define TAVI_SRC_DETECTOR_MODEL_CHECK_H_

#include <string>

#include "tavilib.h"

namespace tavilib {

// The first fault of the model folder at root with the list file list that
// would make a load fail, end the process or run outside the nets' buffers,
// as "path: what"; empty for a sound folder. Builds each net to compare its
// weights with it, and keeps nothing.
std::string cascadeFolderFault(const std::string& root, const std::string& list);

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_MODEL_CHECK_H_
