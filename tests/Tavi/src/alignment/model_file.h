#ifndef TESTS_TAVI_SRC_ALIGNMENT_MODEL_FILE_H_
#define TESTS_TAVI_SRC_ALIGNMENT_MODEL_FILE_H_

#include <cstdint>
#include <sstream>
#include <string>
#include <vector>

#include "alignment/sdm_model.h"
#include "mp/matrix.h"
#include "mp/pca_map.h"

namespace SDMCore {
namespace testing_support {

// What a landmark model file holds, section by section.
struct ModelContents {
  std::vector<mp::matrix> stageMatrices;
  std::vector<mp::matrix> stageBiases;
  std::vector<float> meanShape;
  std::vector<float> auxShape;
  std::vector<mp::pca_map> stageMaps;
  std::vector<int32_t> stageLevels;
  int32_t discarded = 0;
  int32_t modelFlag = 1;
  int32_t scalesPerOctave = 3;
  int32_t faceWidth = 100;
};

inline void PutInt32(std::ostream& out, int32_t value) {
  out.write(reinterpret_cast<const char*>(&value), sizeof value);
}

// The file's bytes, the records written by their own write.
inline std::string ModelBytes(const ModelContents& model) {
  std::ostringstream out;
  PutInt32(out, static_cast<int32_t>(model.stageMatrices.size()));
  for (const mp::matrix& m : model.stageMatrices) m.write(out);
  PutInt32(out, static_cast<int32_t>(model.stageBiases.size()));
  for (const mp::matrix& m : model.stageBiases) m.write(out);
  PutInt32(out, static_cast<int32_t>(model.meanShape.size()));
  out.write(reinterpret_cast<const char*>(model.meanShape.data()),
            static_cast<std::streamsize>(model.meanShape.size() * 4));
  PutInt32(out, static_cast<int32_t>(model.auxShape.size()));
  out.write(reinterpret_cast<const char*>(model.auxShape.data()),
            static_cast<std::streamsize>(model.auxShape.size() * 4));
  PutInt32(out, static_cast<int32_t>(model.stageMaps.size()));
  for (const mp::pca_map& map : model.stageMaps) map.write(out);
  PutInt32(out, static_cast<int32_t>(model.stageLevels.size()));
  out.write(reinterpret_cast<const char*>(model.stageLevels.data()),
            static_cast<std::streamsize>(model.stageLevels.size() * 4));
  PutInt32(out, model.discarded);
  PutInt32(out, model.modelFlag);
  PutInt32(out, model.scalesPerOctave);
  PutInt32(out, model.faceWidth);
  return out.str();
}

// A plausible 68-point mean shape in units of the face box: a jaw line, brows,
// nose, eyes and mouth, all inside (0.1 .. 0.9).
inline std::vector<float> MeanShape68() {
  std::vector<float> shape;
  auto add = [&shape](float x, float y) {
    shape.push_back(x);
    shape.push_back(y);
  };
  for (int i = 0; i < 17; ++i) add(0.1f + 0.05f * i, 0.45f + 0.4f * (1.0f - ((i - 8) * (i - 8)) / 64.0f));
  for (int i = 0; i < 10; ++i) add(0.2f + 0.065f * i, 0.3f);
  for (int i = 0; i < 9; ++i) add(0.5f, 0.35f + 0.03f * i);
  for (int i = 0; i < 12; ++i) add((i < 6 ? 0.3f : 0.6f) + 0.02f * (i % 6), 0.4f + 0.01f * (i % 3));
  for (int i = 0; i < 20; ++i) add(0.35f + 0.015f * i, 0.75f + 0.005f * (i % 4));
  return shape;
}

}  // namespace testing_support
}  // namespace SDMCore

#endif  // TESTS_TAVI_SRC_ALIGNMENT_MODEL_FILE_H_
