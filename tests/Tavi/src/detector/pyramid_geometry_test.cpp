#include "detector/pyramid_geometry.h"

#include <gtest/gtest.h>

namespace tavilib {
namespace {

CascadeParameter Params(int32_t normalizedSize, float maxUpscale, float minFaceRatio) {
  return CascadeParameter{maxUpscale, normalizedSize, minFaceRatio, 3, 1.5f, 12};
}

TEST(PyramidGeometryTest, TheWorkedExample) {
  const PyramidGeometry g = computePyramidGeometry(1600, 1200, Params(320, 1.0f, 0.05f));
  EXPECT_EQ(g.ratio, 0.2f);
  EXPECT_EQ(g.minimumFace, 16);
  EXPECT_EQ(g.baseScale, 0.15f);
  EXPECT_EQ(g.baseWidth, 240);
  EXPECT_EQ(g.baseHeight, 180);
  EXPECT_EQ(levelFactor(1.5f, 0), 1.0f);
  EXPECT_EQ(levelFactor(1.5f, 2), 2.25f);
  EXPECT_EQ(levelLength(240, levelFactor(1.5f, 1)), 160);
  EXPECT_EQ(levelLength(180, levelFactor(1.5f, 1)), 120);
  EXPECT_EQ(levelLength(240, levelFactor(1.5f, 2)), 106);
  EXPECT_EQ(levelLength(180, levelFactor(1.5f, 2)), 80);
  // From the base, not from the level before: 106 / 2.25 is 47, while
  // 106 / 1.5 / 1.5 would give 46.
  EXPECT_EQ(levelLength(106, levelFactor(1.5f, 2)), 47);
}

TEST(PyramidGeometryTest, LargeImagesShrinkFullySmallOnesGrowAtMostByMaxUpscale) {
  // A long edge of exactly normalizedSize: ratio 1 or maxUpscale, the smaller.
  EXPECT_EQ(computePyramidGeometry(320, 200, Params(320, 2.0f, 0.1f)).ratio, 1.0f);
  EXPECT_EQ(computePyramidGeometry(200, 320, Params(320, 0.5f, 0.1f)).ratio, 0.5f);
  // One pixel more: the full ratio, whatever maxUpscale says.
  EXPECT_EQ(computePyramidGeometry(321, 200, Params(320, 0.5f, 0.1f)).ratio, 320.0f / 321.0f);
  // A small image is enlarged by the ratio, capped by maxUpscale.
  EXPECT_EQ(computePyramidGeometry(100, 80, Params(320, 1.0f, 0.1f)).ratio, 1.0f);
  EXPECT_EQ(computePyramidGeometry(100, 80, Params(320, 2.0f, 0.1f)).ratio, 2.0f);
  EXPECT_EQ(computePyramidGeometry(100, 80, Params(320, 8.0f, 0.1f)).ratio, 3.2f);

  // minimum face 32, so the base scale is 12 / 32 * 2 and the base 75 x 60.
  const PyramidGeometry g = computePyramidGeometry(100, 80, Params(320, 2.0f, 0.1f));
  EXPECT_EQ(g.minimumFace, 32);
  EXPECT_EQ(g.baseScale, 0.75f);
  EXPECT_EQ(g.baseWidth, 75);
  EXPECT_EQ(g.baseHeight, 60);
}

}  // namespace
}  // namespace tavilib
