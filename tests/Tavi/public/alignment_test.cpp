// The alignment entry points as a host sees them through libtavi.so. The model
// files are put together byte by byte here, after the documented layout
// (docs/sdm_model_format.md), without the library's own record writers.
#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

#include "tavilib.h"
#include "temp_dir.h"

namespace tavilib {
namespace {

// Sections in order: no matrices, no biases, the mean shape (68 points on a
// grid inside the box), no second list, no maps, no levels, one discarded
// integer, flag, scales per octave, face width.
std::string GridModel() {
  std::string bytes;
  auto put = [&bytes](auto value) {
    static_assert(sizeof value == 4, "four-byte fields");
    bytes.append(reinterpret_cast<const char*>(&value), 4);
  };
  for (int32_t value : {0, 0, 136}) put(value);
  for (int i = 0; i < 68; ++i) put(0.15f + 0.1f * (i % 8)), put(0.1f + 0.09f * (i / 8));
  for (int32_t value : {0, 0, 0, 0, 1, 3, 100}) put(value);
  return bytes;
}

TEST(AlignmentTest, PointsInImagePixelsAndStatusCodes) {
  // The path is folder, "/" and file.
  TempDir dir;
  dir.write("sub/grid.sdm", GridModel());
  ASSERT_EQ(loadSDMModel(dir.path() + "/sub", "grid.sdm"), STATUS_OK);
  std::vector<uint8_t> bytes(640 * 480 * 3, 90);
  const Image image{640, 480, 0, bytes.data()};
  const Rectangle<float> rect{250.0f, 150.0f, 390.0f, 310.0f};
  std::vector<float> points(500, -1.0f);
  EXPECT_EQ(align68Points(image, rect, points), STATUS_OK);
  ASSERT_EQ(points.size(), 136u);
  // The crop is 280 by 320 pixels from (180, 70), the working frame 250 by
  // 250; there the rectangle is (62.5, 62.5) to (187.5, 187.5) and the face
  // box (55, 80, 150, 162). Point k sits at the grid's place in that box, up
  // to the rounding of the box's normalisation.
  for (int k = 0; k < 68; k += 13) {
    EXPECT_NEAR(points[2 * k], 180 + (55 + (0.15 + 0.1 * (k % 8)) * 150) * 280 / 250, 2.0) << k;
    EXPECT_NEAR(points[2 * k + 1], 70 + (80 + (0.1 + 0.09 * (k / 8)) * 162) * 320 / 250, 2.0) << k;
  }
  std::vector<float> five = {1, 2, 3};
  EXPECT_EQ(align5Points(image, rect, five), STATUS_OK);
  EXPECT_EQ(five.size(), 10u);

  // A failed load drops the earlier model. Alignment on the blank record it
  // leaves, or on none at all, gives no points rather than reading past an
  // empty shape.
  EXPECT_EQ(loadSDMModel(dir.path(), "nothing.sdm"), STATUS_MODEL_LOAD_FAILED);
  EXPECT_EQ(align68Points(image, rect, points), STATUS_MODEL_LOAD_FAILED);
  EXPECT_TRUE(points.empty());
  EXPECT_EQ(unloadSDMModel(), STATUS_OK);
  EXPECT_EQ(unloadSDMModel(), STATUS_OK);
  EXPECT_EQ(align5Points(image, rect, five), STATUS_MODEL_LOAD_FAILED);
  EXPECT_TRUE(five.empty());
}

}  // namespace
}  // namespace tavilib
