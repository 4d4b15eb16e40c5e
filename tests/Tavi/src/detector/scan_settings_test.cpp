#include "detector/scan_settings.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <random>

#include "detector/pyramid_geometry.h"

namespace tavilib {
namespace {

TEST(ScanSettingsTest, GiveExactlyTheMinimumFaceAndABaseInsideTheScanInput) {
  std::mt19937 random(3);
  for (int trial = 0; trial < 3000; ++trial) {
    const int columns = 20 + static_cast<int>(random() % 3000);
    const int rows = 20 + static_cast<int>(random() % 3000);
    const int minFace = 1 + static_cast<int>(random() % 150);
    const CascadeParameter settings = fittingScanSettings(columns, rows, minFace, 640, 480);
    const PyramidGeometry geometry =
        computePyramidGeometry(columns, rows, settings);
    ASSERT_LE(geometry.baseWidth, 640) << columns << "x" << rows << " " << minFace;
    ASSERT_LE(geometry.baseHeight, 480) << columns << "x" << rows << " " << minFace;
    const int honoured = minimumFaceOf(settings, columns, rows);
    ASSERT_GE(honoured, minFace);
    if (honoured > minFace) {
      // Only as much larger as the scan input demands.
      const PyramidGeometry smaller = computePyramidGeometry(
          columns, rows, fittingScanSettings(columns, rows, honoured - 1, 100000, 100000));
      ASSERT_TRUE(smaller.baseWidth > 640 || smaller.baseHeight > 480);
    }
  }
}

}  // namespace
}  // namespace tavilib
