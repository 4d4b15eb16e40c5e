#ifndef TOOLS_DETECTOR_TRAINING_SCAN_SETTINGS_H_
#define TOOLS_DETECTOR_TRAINING_SCAN_SETTINGS_H_

#include "tavilib.h"

namespace training {

// The scan step between pyramid levels and the scan window of the trained
// cascade.
constexpr float kScaleStep = 1.2f;
constexpr int kWindowSize = 12;

// Scan settings for an image of columns by rows that look for faces of
// minFace pixels and up, never enlarging the image. Where such a base image
// would exceed maxBase pixels on a side, the smallest minimum face that fits
// is used instead.
tavilib::CascadeParameter scanSettingsFor(int columns, int rows, int minFace, int maxBase);

// The minimum face in pixels of the input image that settings look for.
int minimumFaceOf(const tavilib::CascadeParameter& settings, int columns, int rows);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_SCAN_SETTINGS_H_
