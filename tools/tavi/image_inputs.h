#ifndef TOOLS_TAVI_IMAGE_INPUTS_H_
#define TOOLS_TAVI_IMAGE_INPUTS_H_

#include <string>
#include <vector>

namespace tavi {

// One file to process, and the name its annotated copy gets below --draw.
struct ImageInput {
  std::string path;
  std::string drawName;
};

struct ImageInputs {
  std::vector<ImageInput> files;
  bool anyFolder = false;
};

// The files named on the command line, in the order given; a folder stands
// for every file below it, in name order, with its path below the folder as
// the drawing's name. A path that exists as neither stays in the list, so
// that it is reported like an unreadable file.
ImageInputs listInputs(const std::vector<std::string>& arguments);

}  // namespace tavi

#endif  // TOOLS_TAVI_IMAGE_INPUTS_H_
