#ifndef TAVI_SRC_ALIGNMENT_SDM_MODEL_H_
#define TAVI_SRC_ALIGNMENT_SDM_MODEL_H_

#include <cstdint>
#include <ostream>
#include <string>
#include <vector>

#include "mp/matrix.h"
#include "mp/pca_map.h"

namespace SDMCore {

// The landmark regression model, filled from one binary file (see
// docs/sdm_model_format.md). The number of stages is the number of stageMaps.
struct SDMModel {
  // A record with the built-in defaults and empty lists.
  SDMModel();

  // Pyramid level at which stage i takes its descriptors; stages past the end
  // use the last entry.
  std::vector<int32_t> stageLevels;
  // Scales per octave of the descriptor pyramid.
  int32_t scalesPerOctave;
  // Width in pixels to which the face box is normalised.
  int32_t faceWidth;
  // Read from the file; nothing reads it afterwards.
  int32_t modelFlag;
  // Mean shape in units of the face box: x0, y0, x1, y1, ...
  std::vector<float> meanShape;
  // A second float list of the file; kept, not used.
  std::vector<float> auxShape;
  // Only tested for being non-empty: without them no bias is applied.
  std::vector<mp::matrix> stageMatrices;
  // Per-stage additive term, one row of shape length.
  std::vector<mp::matrix> stageBiases;
  // Per-stage linear map from the feature row (points * 128 floats) to the
  // shape update.
  std::vector<mp::pca_map> stageMaps;
};

// Reads the model file at path into model. Returns false only when the file
// cannot be opened (model is then untouched). Reads are not checked: a short
// or malformed file leaves the stream failed, later reads fetch nothing, and
// the result is still true.
bool readSDMModel(const std::string& path, SDMModel& model);

// Writes model in the file layout readSDMModel reads (the discarded integer
// as 0). Returns whether the stream took all of it.
bool writeSDMModel(std::ostream& stream, const SDMModel& model);

// The process-wide model of loadSDMModel; null when none is loaded.
extern SDMModel* sdmModel;

}  // namespace SDMCore

#endif  // TAVI_SRC_ALIGNMENT_SDM_MODEL_H_
