#ifndef TAVI_SRC_DETECTOR_PYRAMID_GEOMETRY_H_
#define TAVI_SRC_DETECTOR_PYRAMID_GEOMETRY_H_

#include <cstdint>

#include "tavilib.h"

namespace tavilib {

// The sizes of the scan pyramid for one image. Every quantity is computed in
// single precision in a fixed order and truncated where it becomes an
// integer; another order changes a truncated size, and with it the windows.
struct PyramidGeometry {
  // Factor from the image normalised to normalizedSize to the input image.
  float ratio;
  // Smallest face sought, in pixels of the normalised image.
  int32_t minimumFace;
  // Factor from the input image to the base image: a minimum face there is
  // one windowSize window.
  float baseScale;
  int32_t baseWidth;
  int32_t baseHeight;
};

PyramidGeometry computePyramidGeometry(int32_t columns, int32_t rows,
                                       const CascadeParameter& params);

// scaleStep to the power level, by the single-precision power function.
float levelFactor(float scaleStep, int32_t level);

// Size of a level above 0: the base size divided by the level factor, from
// the base and never from the previous level.
int32_t levelLength(int32_t baseLength, float factor);

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_PYRAMID_GEOMETRY_H_
