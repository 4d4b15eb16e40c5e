#ifndef TESTS_TAVI_SRC_ALIGNMENT_MODEL_FILE_H_
#define TESTS_TAVI_SRC_ALIGNMENT_MODEL_FILE_H_

#include <cstdint>
#include <sstream>
#include <string>
#include <vector>

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
  auto records = [&out](const auto& list) {
    PutInt32(out, static_cast<int32_t>(list.size()));
    for (const auto& record : list) record.write(out);
  };
  auto values = [&out](const auto& list) {
    PutInt32(out, static_cast<int32_t>(list.size()));
    out.write(reinterpret_cast<const char*>(list.data()), static_cast<std::streamsize>(list.size() * 4));
  };
  records(model.stageMatrices);
  records(model.stageBiases);
  values(model.meanShape);
  values(model.auxShape);
  records(model.stageMaps);
  values(model.stageLevels);
  for (int32_t value : {model.discarded, model.modelFlag, model.scalesPerOctave, model.faceWidth}) {
    PutInt32(out, value);
  }
  return out.str();
}

// 68 points on a grid inside the face box, in box units.
inline std::vector<float> MeanShape68() {
  std::vector<float> shape;
  for (int i = 0; i < 68; ++i) {
    shape.push_back(0.15f + 0.1f * (i % 8));
    shape.push_back(0.1f + 0.09f * (i / 8));
  }
  return shape;
}

}  // namespace testing_support
}  // namespace SDMCore

#endif  // TESTS_TAVI_SRC_ALIGNMENT_MODEL_FILE_H_
