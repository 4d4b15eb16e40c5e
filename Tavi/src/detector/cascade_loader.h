#ifndef TAVI_SRC_DETECTOR_CASCADE_LOADER_H_
#define TAVI_SRC_DETECTOR_CASCADE_LOADER_H_

#include <string>

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

// One stage folder, without the lock: in the full form (the primed scan net,
// no mean) or the deploy form (net and mean). File names are appended to the
// folder as it stands; a folder ending in a separator gives a doubled one,
// which is harmless. The trainers load the stages they have so far this way.
CascadeStage loadFullStage(const std::string& folder);
CascadeStage loadDeployStage(const std::string& folder);

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_CASCADE_LOADER_H_
