#include "detector_training/scan_settings.h"

#include <algorithm>
#include <cmath>

#include "detector/pyramid_geometry.h"

namespace training {

namespace {

// More levels than any image needs: the scan stops by itself when a level
// gets smaller than a window.
constexpr int kScales = 40;

tavilib::CascadeParameter settingsWith(int longEdge, int minFace) {
  tavilib::CascadeParameter settings{1.0f, longEdge, 0.0f, kScales, kScaleStep, kWindowSize};
  // The ratio is nudged up until the single-precision product truncates to
  // exactly minFace.
  settings.minFaceRatio = static_cast<float>(minFace) / static_cast<float>(longEdge);
  while (static_cast<int>(static_cast<float>(longEdge) * settings.minFaceRatio) < minFace) {
    settings.minFaceRatio = std::nextafter(settings.minFaceRatio, 1.0f);
  }
  return settings;
}

}  // namespace

tavilib::CascadeParameter scanSettingsFor(int columns, int rows, int minFace, int maxBase) {
  const int longEdge = std::max(columns, rows);
  for (int face = std::max(minFace, 1);; ++face) {
    const tavilib::CascadeParameter settings = settingsWith(longEdge, face);
    const tavilib::PyramidGeometry geometry =
        tavilib::computePyramidGeometry(columns, rows, settings);
    if (geometry.baseWidth <= maxBase && geometry.baseHeight <= maxBase) {
      return settings;
    }
  }
}

int minimumFaceOf(const tavilib::CascadeParameter& settings, int columns, int rows) {
  return tavilib::computePyramidGeometry(columns, rows, settings).minimumFace;
}

}  // namespace training
