#ifndef TOOLS_TAVI_BATCH_H_
#define TOOLS_TAVI_BATCH_H_

#include <functional>
#include <vector>

#include "tavi/face_finder.h"
#include "tavi/image_inputs.h"

namespace tavi {

// Processes inputs on threads workers, each with a FaceFinder of its own, and
// hands every report to emit on the calling thread in input order, as soon
// as it and all before it are done. progress, if set, is called on the
// calling thread after each report with the count done so far.
// Throws what a worker's FaceFinder constructor throws.
void runBatch(const std::vector<ImageInput>& inputs, const FinderSettings& settings, int threads,
              const std::function<void(const ImageReport&)>& emit,
              const std::function<void(size_t)>& progress);

}  // namespace tavi

#endif  // TOOLS_TAVI_BATCH_H_
