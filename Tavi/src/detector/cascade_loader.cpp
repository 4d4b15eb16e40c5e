#include "detector/cascade_loader.h"

namespace tavilib {

// Networks can't be built yet: every load ends in the failed state.
Status loadCascadeFromFolder(DetectorState&, const DetectorParams&) {
  return STATUS_MODEL_LOAD_FAILED;
}

Status loadBuiltInCascade(DetectorState&) { return STATUS_MODEL_LOAD_FAILED; }

}  // namespace tavilib
