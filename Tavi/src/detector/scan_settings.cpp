#include "detector/scan_settings.h"

#include <algorithm>
#include <cmath>
#include <stdexcept>

#include "detector/detector_state.h"
#include "detector/pyramid_geometry.h"
#include "nn/net.h"

namespace tavilib {

namespace {

// More levels than any image needs: the scan stops by itself when a level
// gets smaller than a window.
constexpr int32_t kScales = 40;

CascadeParameter settingsWith(int32_t longEdge, int32_t minFace) {
  CascadeParameter settings{1.0f, longEdge, 0.0f, kScales, kScaleStep, kWindowSize};
  // The ratio is nudged up until the single-precision product truncates to
  // exactly minFace (100 / 53 times 53 would give 99).
  settings.minFaceRatio = static_cast<float>(minFace) / static_cast<float>(longEdge);
  while (static_cast<int32_t>(static_cast<float>(longEdge) * settings.minFaceRatio) < minFace) {
    settings.minFaceRatio = std::nextafter(settings.minFaceRatio, HUGE_VALF);
  }
  return settings;
}

}  // namespace

CascadeParameter fittingScanSettings(int32_t columns, int32_t rows, int32_t minFace,
                                     int32_t maxWidth, int32_t maxHeight) {
  const int32_t longEdge = std::max(columns, rows);
  for (int32_t face = minFace;; ++face) {
    const CascadeParameter settings = settingsWith(longEdge, face);
    const PyramidGeometry geometry = computePyramidGeometry(columns, rows, settings);
    if (geometry.baseWidth <= maxWidth && geometry.baseHeight <= maxHeight) {
      return settings;
    }
  }
}

int32_t minimumFaceOf(const CascadeParameter& settings, int32_t columns, int32_t rows) {
  return computePyramidGeometry(columns, rows, settings).minimumFace;
}

Status scanSettingsFor(const Detector& detector, int32_t width, int32_t height, int32_t minFace,
                       ScanSettings& settings) {
  if (width < 1 || height < 1 || minFace < 1) {
    throw std::invalid_argument("scanSettingsFor: width, height and minFace must be at least 1");
  }
  const auto* state = static_cast<const DetectorState*>(detector.getDetector());
  if (state == nullptr || !state->ready) {
    return STATUS_DETECTOR_NOT_READY;
  }
  const nn::Net<float>& scan = *state->stages.front().net;
  settings.params = fittingScanSettings(width, height, minFace, scan.declared_input_width(),
                                        scan.declared_input_height());
  settings.minFace = minimumFaceOf(settings.params, width, height);
  return STATUS_OK;
}

}  // namespace tavilib
