// The alignment entry points as a host sees them through libtavi.so. The model
// files are put together byte by byte here, after the documented layout
// (docs/sdm_model_format.md), without the library's own record writers.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <string>
#include <vector>

#include "tavilib.h"
#include "temp_dir.h"

namespace tavilib {
namespace {

class ModelBuilder {
 public:
  ModelBuilder& Int32(int32_t value) { return Raw(&value, 4); }
  ModelBuilder& Int64(int64_t value) { return Raw(&value, 8); }
  ModelBuilder& Float(float value) { return Raw(&value, 4); }
  // A matrix record: rows, columns as int64, then the elements.
  ModelBuilder& Matrix(int64_t rows, int64_t columns, const std::vector<float>& values) {
    Int64(rows).Int64(columns);
    for (float v : values) Float(v);
    return *this;
  }
  const std::string& bytes() const { return bytes_; }

 private:
  ModelBuilder& Raw(const void* data, size_t size) {
    bytes_.append(static_cast<const char*>(data), size);
    return *this;
  }
  std::string bytes_;
};

// 68 points on a grid inside the box.
std::vector<float> GridMean() {
  std::vector<float> mean;
  for (int i = 0; i < 68; ++i) {
    mean.push_back(0.15f + 0.1f * (i % 8));
    mean.push_back(0.1f + 0.09f * (i / 8));
  }
  return mean;
}

// Sections in order: matrices, biases, mean shape, second list, maps, levels,
// one discarded integer, flag, scales per octave, face width.
std::string ModelWithStages(int stages, float biasX, float biasY) {
  ModelBuilder model;
  model.Int32(stages > 0 ? 1 : 0);
  if (stages > 0) model.Matrix(1, 1, {0.0f});
  model.Int32(stages);
  for (int s = 0; s < stages; ++s) {
    std::vector<float> bias;
    for (int q = 0; q < 68; ++q) {
      bias.push_back(biasX);
      bias.push_back(biasY);
    }
    model.Matrix(1, 136, bias);
  }
  const std::vector<float> mean = GridMean();
  model.Int32(136);
  for (float v : mean) model.Float(v);
  model.Int32(0);
  model.Int32(stages);
  for (int s = 0; s < stages; ++s) {
    model.Matrix(1, 68 * 128, std::vector<float>(68 * 128, 0.5f));
    model.Matrix(68 * 128, 136, std::vector<float>(68 * 128 * 136, 0.0f));
  }
  model.Int32(3).Int32(2).Int32(1).Int32(0);
  model.Int32(0).Int32(1).Int32(3).Int32(100);
  return model.bytes();
}

std::vector<uint8_t> Texture(int width, int height) {
  std::vector<uint8_t> bytes(static_cast<size_t>(width) * height * 3);
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      for (int c = 0; c < 3; ++c) {
        bytes[(static_cast<size_t>(y) * width + x) * 3 + c] =
            static_cast<uint8_t>(128 + 100 * std::sin(x * 0.1 + c) * std::cos(y * 0.07));
      }
    }
  }
  return bytes;
}

class AlignmentTest : public testing::Test {
 protected:
  void TearDown() override { unloadSDMModel(); }
  TempDir dir_;
};

TEST_F(AlignmentTest, FortyByteModelLoads) {
  ModelBuilder model;
  for (int i = 0; i < 6; ++i) model.Int32(0);
  model.Int32(0).Int32(1).Int32(3).Int32(100);
  ASSERT_EQ(model.bytes().size(), 40u);
  dir_.write("empty.sdm", model.bytes());
  EXPECT_EQ(loadSDMModel(dir_.path(), "empty.sdm"), STATUS_OK);
  EXPECT_EQ(unloadSDMModel(), STATUS_OK);
}

TEST_F(AlignmentTest, MissingFileIsRefused) {
  EXPECT_EQ(loadSDMModel(dir_.path(), "nothing.sdm"), STATUS_MODEL_LOAD_FAILED);
  // Alignment on the blank record a failed load leaves, or on none at all,
  // gives no points rather than reading past an empty shape.
  std::vector<uint8_t> pixels = Texture(120, 100);
  const Image image{120, 100, 0, pixels.data()};
  std::vector<float> points(3, 1.0f);
  EXPECT_EQ(align68Points(image, Rectangle<float>{20, 20, 80, 80}, points),
            STATUS_MODEL_LOAD_FAILED);
  EXPECT_TRUE(points.empty());
  EXPECT_EQ(unloadSDMModel(), STATUS_OK);
  EXPECT_EQ(unloadSDMModel(), STATUS_OK);
  points.assign(3, 1.0f);
  EXPECT_EQ(align5Points(image, Rectangle<float>{20, 20, 80, 80}, points),
            STATUS_MODEL_LOAD_FAILED);
  EXPECT_TRUE(points.empty());
}

TEST_F(AlignmentTest, SixtyEightPointsInImagePixels) {
  dir_.write("model.sdm", ModelWithStages(0, 0, 0));
  ASSERT_EQ(loadSDMModel(dir_.path(), "model.sdm"), STATUS_OK);
  std::vector<uint8_t> bytes = Texture(640, 480);
  const Image image{640, 480, 0, bytes.data()};
  const Rectangle<float> rect{250.0f, 150.0f, 390.0f, 310.0f};
  std::vector<float> points(500, -1.0f);
  EXPECT_EQ(align68Points(image, rect, points), STATUS_OK);
  ASSERT_EQ(points.size(), 136u);
  // The grid lies in the face box, which is the rectangle widened by a fifth
  // and moved down by 0.15 of its height.
  for (int k = 0; k < 68; ++k) {
    EXPECT_GT(points[2 * k], rect.left - 20) << k;
    EXPECT_LT(points[2 * k], rect.right + 20) << k;
    EXPECT_GT(points[2 * k + 1], rect.top) << k;
    EXPECT_LT(points[2 * k + 1], rect.bottom + 40) << k;
  }
  // The crop is 280 by 320 pixels from (180, 70), the working frame 250 by
  // 250; there the rectangle is (62.5, 62.5) to (187.5, 187.5) and the face
  // box (55, 80, 150, 162). Point 0 sits at 0.15, 0.1 of that box, up to the
  // rounding of the box's normalisation.
  EXPECT_NEAR(points[0], 180 + (55 + 0.15 * 150) * 280 / 250, 2.0);
  EXPECT_NEAR(points[1], 70 + (80 + 0.1 * 162) * 320 / 250, 2.0);
}

TEST_F(AlignmentTest, StageBiasesMoveThePoints) {
  dir_.write("still.sdm", ModelWithStages(0, 0, 0));
  dir_.write("moved.sdm", ModelWithStages(2, 3.0f, -1.5f));
  std::vector<uint8_t> bytes = Texture(640, 480);
  const Image image{640, 480, 0, bytes.data()};
  const Rectangle<float> rect{250.0f, 150.0f, 390.0f, 310.0f};
  std::vector<float> still;
  std::vector<float> moved;
  ASSERT_EQ(loadSDMModel(dir_.path(), "still.sdm"), STATUS_OK);
  align68Points(image, rect, still);
  ASSERT_EQ(loadSDMModel(dir_.path(), "moved.sdm"), STATUS_OK);
  align68Points(image, rect, moved);
  // Two stages of (3, -1.5) normalised pixels; the face box of 150 pixels of
  // the frame is normalised to 100, and the frame is 280 by 320 image pixels.
  for (int k = 0; k < 68; ++k) {
    EXPECT_NEAR(moved[2 * k] - still[2 * k], 6.0 * 1.5 * 280 / 250, 0.01) << k;
    EXPECT_NEAR(moved[2 * k + 1] - still[2 * k + 1], -3.0 * 1.5 * 320 / 250, 0.01) << k;
  }
}

TEST_F(AlignmentTest, FivePointsComeFromTheSixtyEight) {
  dir_.write("model.sdm", ModelWithStages(1, 0.5f, 0.25f));
  ASSERT_EQ(loadSDMModel(dir_.path(), "model.sdm"), STATUS_OK);
  std::vector<uint8_t> bytes = Texture(400, 300);
  const Image image{400, 300, 0, bytes.data()};
  const Rectangle<float> rect{120.0f, 80.0f, 230.0f, 200.0f};
  std::vector<float> all;
  std::vector<float> five = {1, 2, 3};
  align68Points(image, rect, all);
  EXPECT_EQ(align5Points(image, rect, five), STATUS_OK);
  ASSERT_EQ(five.size(), 10u);
  float x = 0;
  float y = 0;
  for (int i = 36; i <= 41; ++i) {
    x += all[2 * i];
    y += all[2 * i + 1];
  }
  EXPECT_EQ(five[0], x / 6);
  EXPECT_EQ(five[1], y / 6);
  EXPECT_EQ(five[4], all[60]);
  EXPECT_EQ(five[5], all[61]);
  EXPECT_EQ(five[6], all[96]);
  EXPECT_EQ(five[7], all[97]);
  EXPECT_EQ(five[8], all[108]);
  EXPECT_EQ(five[9], all[109]);
}

TEST_F(AlignmentTest, StrideIsIgnored) {
  dir_.write("model.sdm", ModelWithStages(1, 0.5f, 0.25f));
  ASSERT_EQ(loadSDMModel(dir_.path(), "model.sdm"), STATUS_OK);
  std::vector<uint8_t> bytes = Texture(400, 300);
  const Rectangle<float> rect{120.0f, 80.0f, 230.0f, 200.0f};
  std::vector<float> packed;
  std::vector<float> strided;
  align68Points(Image{400, 300, 0, bytes.data()}, rect, packed);
  align68Points(Image{400, 300, 4000, bytes.data()}, rect, strided);
  EXPECT_EQ(packed, strided);
}

}  // namespace
}  // namespace tavilib
