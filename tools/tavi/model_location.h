#ifndef TOOLS_TAVI_MODEL_LOCATION_H_
#define TOOLS_TAVI_MODEL_LOCATION_H_

#include <string>

namespace tavi {

// The model folder (ending in a separator) holding cascade.list, cascades/
// and landmarks.sdm: the installed one beside the program
// (<prefix>/share/tavi/ for <prefix>/bin/tavi), else the source tree's
// Tavi/public/ that a build-tree program was built from. Empty if neither
// holds a list file.
std::string defaultModelFolder();

}  // namespace tavi

#endif  // TOOLS_TAVI_MODEL_LOCATION_H_
