#include "detector/pyramid_geometry.h"

#include <algorithm>
#include <cmath>
#include <stdexcept>

namespace tavilib {

namespace {

// value truncated toward zero, refusing settings that would give a value no
// int32_t holds.
int32_t truncated(float value) {
  if (!(value >= -2147483648.0f && value < 2147483648.0f)) {
    throw std::invalid_argument("detect: scan settings that give no usable base image");
  }
  return static_cast<int32_t>(value);
}

}  // namespace

PyramidGeometry computePyramidGeometry(int32_t columns, int32_t rows,
                                       const CascadeParameter& params) {
  if (params.normalizedSize < 1 || params.windowSize < 1 || !(params.minFaceRatio > 0.0f) ||
      !(params.maxUpscale > 0.0f) || !(params.scaleStep > 1.0f) ||
      !std::isfinite(params.scaleStep)) {
    throw std::invalid_argument(
        "detect: scan settings need normalizedSize, windowSize, minFaceRatio and maxUpscale above "
        "0 and a finite scaleStep above 1");
  }
  PyramidGeometry geometry;
  const int32_t longEdge = std::max(rows, columns);
  geometry.ratio = static_cast<float>(params.normalizedSize) / static_cast<float>(longEdge);
  // A smaller image is enlarged by ratio, but by no more than maxUpscale.
  if (longEdge <= params.normalizedSize && !(params.maxUpscale > geometry.ratio)) {
    geometry.ratio = params.maxUpscale;
  }
  geometry.minimumFace = truncated(static_cast<float>(params.normalizedSize) * params.minFaceRatio);
  if (geometry.minimumFace < 1) {
    throw std::invalid_argument("detect: scan settings whose minimum face is below one pixel");
  }
  geometry.baseScale = static_cast<float>(params.windowSize) /
                       static_cast<float>(geometry.minimumFace) * geometry.ratio;
  geometry.baseWidth = truncated(static_cast<float>(columns) * geometry.baseScale);
  geometry.baseHeight = truncated(static_cast<float>(rows) * geometry.baseScale);
  return geometry;
}

float levelFactor(float scaleStep, int32_t level) {
  return std::pow(scaleStep, static_cast<float>(level));
}

int32_t levelLength(int32_t baseLength, float factor) {
  return static_cast<int32_t>(static_cast<float>(baseLength) / factor);
}

}  // namespace tavilib
