#ifndef TAVI_SRC_DETECTOR_SCAN_SETTINGS_H_
#define TAVI_SRC_DETECTOR_SCAN_SETTINGS_H_

#include <cstdint>

#include "tavilib.h"

namespace tavilib {

// The scan step between pyramid levels and the scan window of the trained
// cascade.
constexpr float kScaleStep = 1.2f;
constexpr int32_t kWindowSize = 12;

// Scan settings for an image of columns by rows that look for faces of
// minFace pixels and up, never normalising the image to another size. Where
// the base image would exceed maxWidth by maxHeight, the smallest minimum face
// whose base image fits is used instead.
// REQUIRES: columns, rows, minFace, maxWidth and maxHeight at least 1.
CascadeParameter fittingScanSettings(int32_t columns, int32_t rows, int32_t minFace,
                                     int32_t maxWidth, int32_t maxHeight);

// The minimum face in pixels of the input image that settings look for.
int32_t minimumFaceOf(const CascadeParameter& settings, int32_t columns, int32_t rows);

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_SCAN_SETTINGS_H_
