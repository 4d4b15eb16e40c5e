#ifndef TAVI_SRC_DETECTOR_CASCADE_LOADER_H_
#define TAVI_SRC_DETECTOR_CASCADE_LOADER_H_

#include "detector/detector_state.h"
#include "tavilib.h"

namespace tavilib {

// Fill a fresh state with the stages and the calibration net, from the model
// folder named by params or from the built-in tables (whose weight files are
// found relative to the working directory). Both hold the process-wide load
// lock while they build nets. A missing list file, or one without stages,
// gives STATUS_MODEL_LOAD_FAILED; a missing or malformed network file ends
// the process.
Status loadCascadeFromFolder(DetectorState& state, const DetectorParams& params);
Status loadBuiltInCascade(DetectorState& state);

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_CASCADE_LOADER_H_
