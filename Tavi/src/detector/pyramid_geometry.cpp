#include "detector/pyramid_geometry.h"

#include <algorithm>
#include <cmath>

namespace tavilib {

PyramidGeometry computePyramidGeometry(int32_t columns, int32_t rows,
                                       const CascadeParameter& params) {
  PyramidGeometry geometry;
  const int32_t longEdge = std::max(rows, columns);
  geometry.ratio = static_cast<float>(params.normalizedSize) / static_cast<float>(longEdge);
  // A smaller image is enlarged by ratio, but by no more than maxUpscale.
  if (longEdge <= params.normalizedSize && !(params.maxUpscale > geometry.ratio)) {
    geometry.ratio = params.maxUpscale;
  }
  geometry.minimumFace =
      static_cast<int32_t>(static_cast<float>(params.normalizedSize) * params.minFaceRatio);
  geometry.baseScale = static_cast<float>(params.windowSize) /
                       static_cast<float>(geometry.minimumFace) * geometry.ratio;
  geometry.baseWidth = static_cast<int32_t>(static_cast<float>(columns) * geometry.baseScale);
  geometry.baseHeight = static_cast<int32_t>(static_cast<float>(rows) * geometry.baseScale);
  return geometry;
}

float levelFactor(float scaleStep, int32_t level) {
  return std::pow(scaleStep, static_cast<float>(level));
}

int32_t levelLength(int32_t baseLength, float factor) {
  return static_cast<int32_t>(static_cast<float>(baseLength) / factor);
}

}  // namespace tavilib
