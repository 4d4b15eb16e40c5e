#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include <opencv2/core.hpp>

#include "alignment/sdm_model.h"
#include "alignment/sdm_regression.h"
#include "model_file.h"
#include "tavilib.h"
#include "temp_dir.h"

namespace tavilib {
namespace {

using SDMCore::testing_support::MeanShape68;
using SDMCore::testing_support::ModelBytes;
using SDMCore::testing_support::ModelContents;

std::vector<uint8_t> RandomBytes(size_t count, uint32_t seed) {
  std::mt19937 generator(seed);
  std::vector<uint8_t> bytes(count);
  for (uint8_t& b : bytes) b = static_cast<uint8_t>(generator() % 256);
  return bytes;
}

// Smooth colour texture so that descriptors carry structure.
std::vector<uint8_t> TextureBytes(int width, int height) {
  std::vector<uint8_t> bytes(static_cast<size_t>(width) * height * 3);
  for (int y = 0; y < height; ++y) {
    for (int x = 0; x < width; ++x) {
      for (int c = 0; c < 3; ++c) {
        const double v = 128 + 70 * std::sin(x * (0.07 + 0.02 * c)) * std::cos(y * 0.05) +
                         30 * std::sin((x - y) * 0.11);
        bytes[(static_cast<size_t>(y) * width + x) * 3 + c] = static_cast<uint8_t>(std::clamp(v, 0.0, 255.0));
      }
    }
  }
  return bytes;
}

Image MakeImage(int width, int height, std::vector<uint8_t>& bytes) {
  return Image{width, height, 0, bytes.data()};
}

// A model without stages: the result is the median of the nine starts, which
// depends on the geometry only.
ModelContents StageFreeModel() {
  ModelContents model;
  model.meanShape = MeanShape68();
  model.faceWidth = 100;
  return model;
}

// The geometry of the driver for a stage-free model, step by step: crop,
// working frame, face box, enlargement, normalisation, starts, median, and
// back to image pixels.
std::vector<float> StageFreePoints(int width, int height, Rectangle<float> rect, bool crop,
                                   const std::vector<float>& mean, int faceWidth) {
  float left = rect.left;
  float top = rect.top;
  float right = rect.right;
  float bottom = rect.bottom;
  const float w = right - left;
  const float h = bottom - top;
  float cropX = 0;
  float cropY = 0;
  int columns = width;
  int rows = height;
  if (crop) {
    cropX = std::max(left - w * 0.5f, 0.0f);
    cropY = std::max(top - h * 0.5f, 0.0f);
    float regionRight = right + w * 0.5f;
    if (!(static_cast<float>(width) > regionRight)) regionRight = static_cast<float>(width - 1);
    float regionBottom = bottom + h * 0.5f;
    if (!(static_cast<float>(height) > regionBottom)) regionBottom = static_cast<float>(height - 1);
    columns = static_cast<int>(regionRight - cropX);
    rows = static_cast<int>(regionBottom - cropY);
    left -= cropX;
    right -= cropX;
    top -= cropY;
    bottom -= cropY;
  }
  float scaleX = 1;
  float scaleY = 1;
  if (columns != 250 || rows != 250) {
    scaleX = 250.0f / columns;
    scaleY = 250.0f / rows;
  }
  left *= scaleX;
  right *= scaleX;
  top *= scaleY;
  bottom *= scaleY;
  const int boxX = static_cast<int>(left);
  const int boxY = static_cast<int>(top);
  const int boxW = static_cast<int>(right - left);
  const int boxH = static_cast<int>(bottom - top);
  const float a = boxW * 0.1f;
  const float b = boxH * 0.15f;
  cv::Rect face(static_cast<int>(boxX - static_cast<double>(a) * 0.5), static_cast<int>(boxY + b),
                static_cast<int>(a + a + boxW), static_cast<int>(b + b + boxH));
  const float scale = static_cast<float>(faceWidth) / static_cast<float>(face.width);
  face = cv::Rect(static_cast<int>(face.x * scale), static_cast<int>(face.y * scale),
                  static_cast<int>(face.width * scale), static_cast<int>(face.height * scale));
  // The regression pads the normalised frame and takes the padding off again.
  const cv::Mat normalised(static_cast<int>(250 * scale), static_cast<int>(250 * scale), CV_8UC1);
  std::vector<std::vector<float>> starts = SDMCore::startShapes(mean, face);
  cv::Mat padded;
  const float pad = static_cast<float>(SDMCore::padForShape(normalised, starts[0], padded));
  for (std::vector<float>& start : starts) {
    for (float& v : start) v += pad;
  }
  std::vector<float> shape = SDMCore::coordinateMedian(starts);
  for (float& v : shape) v -= pad;
  std::vector<float> points(136);
  for (int k = 0; k < 68; ++k) {
    points[2 * k] = (shape[2 * k] / scale) / scaleX + cropX;
    points[2 * k + 1] = (shape[2 * k + 1] / scale) / scaleY + cropY;
  }
  return points;
}

class AlignmentDriverTest : public testing::Test {
 protected:
  void TearDown() override { unloadSDMModel(); }

  void Load(const ModelContents& model) {
    ASSERT_EQ(loadSDMModel(dir_.path(), dir_.write("model.bin", ModelBytes(model)).substr(dir_.path().size() + 1)),
              STATUS_OK);
  }

  TempDir dir_;
};

TEST_F(AlignmentDriverTest, LoadSetsDefaultsFirstAndReadsTheFile) {
  ModelContents contents;
  contents.faceWidth = 90;
  contents.scalesPerOctave = 4;
  Load(contents);
  ASSERT_NE(SDMCore::sdmModel, nullptr);
  EXPECT_EQ(SDMCore::sdmModel->faceWidth, 90);
  EXPECT_EQ(SDMCore::sdmModel->scalesPerOctave, 4);
}

TEST_F(AlignmentDriverTest, FailedLoadDropsTheEarlierModelAndLeavesABlankOne) {
  ModelContents contents;
  contents.faceWidth = 90;
  Load(contents);
  EXPECT_EQ(loadSDMModel(dir_.path(), "missing.bin"), STATUS_MODEL_LOAD_FAILED);
  ASSERT_NE(SDMCore::sdmModel, nullptr);
  EXPECT_EQ(SDMCore::sdmModel->faceWidth, 100);
  EXPECT_EQ(SDMCore::sdmModel->stageLevels.size(), 10u);
  EXPECT_TRUE(SDMCore::sdmModel->meanShape.empty());
}

TEST_F(AlignmentDriverTest, PathIsFolderSlashFile) {
  dir_.write("sub/model.bin", ModelBytes(StageFreeModel()));
  EXPECT_EQ(loadSDMModel(dir_.path() + "/sub", "model.bin"), STATUS_OK);
  EXPECT_EQ(loadSDMModel(dir_.path(), "sub/model.bin"), STATUS_OK);
  EXPECT_EQ(loadSDMModel(dir_.path() + "/", "sub/model.bin"), STATUS_OK);
  EXPECT_EQ(loadSDMModel(dir_.path() + "/sub/model.bin", ""), STATUS_MODEL_LOAD_FAILED);
}

TEST_F(AlignmentDriverTest, UnloadTwiceIsFine) {
  Load(StageFreeModel());
  EXPECT_EQ(unloadSDMModel(), STATUS_OK);
  EXPECT_EQ(SDMCore::sdmModel, nullptr);
  EXPECT_EQ(unloadSDMModel(), STATUS_OK);
}

TEST_F(AlignmentDriverTest, StageFreeModelGivesTheMedianStartInImagePixels) {
  Load(StageFreeModel());
  std::vector<uint8_t> bytes = RandomBytes(640 * 480 * 3, 1);
  const Rectangle<float> rect{200.5f, 150.25f, 330.0f, 290.75f};
  std::vector<float> points(3, 7.0f);
  EXPECT_EQ(align68Points(MakeImage(640, 480, bytes), rect, points), STATUS_OK);
  ASSERT_EQ(points.size(), 136u);
  EXPECT_EQ(points, StageFreePoints(640, 480, rect, true, MeanShape68(), 100));
}

TEST_F(AlignmentDriverTest, FrameOfExactly250IsNotResized) {
  Load(StageFreeModel());
  std::vector<uint8_t> bytes = RandomBytes(250 * 250 * 3, 2);
  const Rectangle<float> rect{60.0f, 70.0f, 190.0f, 200.0f};  // half or more: no crop
  std::vector<float> points;
  align68Points(MakeImage(250, 250, bytes), rect, points);
  EXPECT_EQ(points, StageFreePoints(250, 250, rect, false, MeanShape68(), 100));
}

TEST_F(AlignmentDriverTest, CropTestUsesTheHalvedWidthRoundedDown) {
  Load(StageFreeModel());
  std::vector<uint8_t> bytes = RandomBytes(101 * 300 * 3, 3);
  const Image image = MakeImage(101, 300, bytes);
  // 101 / 2 = 50: a width of 50 is not smaller, no crop; the height is
  // more than half as well.
  const Rectangle<float> noCrop{20.0f, 40.0f, 70.0f, 200.0f};
  std::vector<float> points;
  align68Points(image, noCrop, points);
  EXPECT_EQ(points, StageFreePoints(101, 300, noCrop, false, MeanShape68(), 100));
  EXPECT_NE(points, StageFreePoints(101, 300, noCrop, true, MeanShape68(), 100));
  // 49.5 is below 50: crop.
  const Rectangle<float> crop{20.0f, 40.0f, 69.5f, 200.0f};
  align68Points(image, crop, points);
  EXPECT_EQ(points, StageFreePoints(101, 300, crop, true, MeanShape68(), 100));
  EXPECT_NE(points, StageFreePoints(101, 300, crop, false, MeanShape68(), 100));
  // A height below half crops too, whatever the width.
  const Rectangle<float> flat{20.0f, 40.0f, 70.0f, 180.0f};
  align68Points(image, flat, points);
  EXPECT_EQ(points, StageFreePoints(101, 300, flat, true, MeanShape68(), 100));
}

TEST_F(AlignmentDriverTest, CropRegionIsClippedAtTheImageEdges) {
  Load(StageFreeModel());
  std::vector<uint8_t> bytes = RandomBytes(640 * 480 * 3, 4);
  // Partly outside on the left and at the bottom right.
  for (const Rectangle<float>& rect : {Rectangle<float>{-30.0f, 10.0f, 90.0f, 120.0f},
                                       Rectangle<float>{560.0f, 380.0f, 650.0f, 470.0f}}) {
    std::vector<float> points;
    align68Points(MakeImage(640, 480, bytes), rect, points);
    EXPECT_EQ(points, StageFreePoints(640, 480, rect, true, MeanShape68(), 100));
  }
}

TEST_F(AlignmentDriverTest, RectangleWhollyOutsideRaisesTheImageLibrarysError) {
  Load(StageFreeModel());
  std::vector<uint8_t> bytes = RandomBytes(200 * 200 * 3, 5);
  std::vector<float> points;
  EXPECT_THROW(align68Points(MakeImage(200, 200, bytes), Rectangle<float>{400, 400, 450, 450}, points),
               cv::Exception);
  // Inverted: a negative region.
  EXPECT_THROW(align68Points(MakeImage(200, 200, bytes), Rectangle<float>{100, 100, 60, 60}, points),
               cv::Exception);
}

TEST_F(AlignmentDriverTest, FivePointsAreTheListedMeans) {
  ModelContents contents = StageFreeModel();
  // One stage with random maps, so that the points are not a regular grid.
  const int D = 68 * 128;
  mp::pca_map map;
  map.mean = mp::matrix(1, D);
  map.projection = mp::matrix(D, 136);
  std::mt19937 generator(6);
  std::uniform_real_distribution<float> value(-0.02f, 0.02f);
  for (int i = 0; i < D; ++i) map.mean.data()[i] = value(generator) + 0.02f;
  for (int64_t i = 0; i < map.projection.size(); ++i) map.projection.data()[i] = value(generator);
  contents.stageMaps.push_back(map);
  Load(contents);
  std::vector<uint8_t> bytes = TextureBytes(320, 240);
  const Image image = MakeImage(320, 240, bytes);
  const Rectangle<float> rect{100.0f, 60.0f, 200.0f, 170.0f};
  std::vector<float> all;
  align68Points(image, rect, all);
  std::vector<float> five(1, 0.0f);
  EXPECT_EQ(align5Points(image, rect, five), STATUS_OK);
  ASSERT_EQ(five.size(), 10u);
  const std::vector<std::vector<int>> groups = {
      {36, 37, 38, 39, 40, 41}, {42, 43, 44, 45, 46, 47}, {30}, {48}, {54}};
  for (size_t g = 0; g < groups.size(); ++g) {
    float x = 0;
    float y = 0;
    for (int i : groups[g]) {
      x += all[2 * i];
      y += all[2 * i + 1];
    }
    EXPECT_EQ(five[2 * g], x / groups[g].size()) << g;
    EXPECT_EQ(five[2 * g + 1], y / groups[g].size()) << g;
  }
  EXPECT_EQ(five[4], all[60]);
  EXPECT_EQ(five[5], all[61]);
  EXPECT_EQ(five[6], all[96]);
  EXPECT_EQ(five[8], all[108]);
}

TEST_F(AlignmentDriverTest, BiasOfARealSizedStageMovesEveryPoint) {
  ModelContents contents = StageFreeModel();
  const int D = 68 * 128;
  mp::pca_map map;
  map.mean = mp::matrix(1, D);
  map.projection = mp::matrix(D, 136);  // zero: the bias alone moves the points
  contents.stageMaps.push_back(map);
  contents.stageMatrices.push_back(mp::matrix(1, 1));
  mp::matrix bias(1, 136);
  for (int q = 0; q < 136; ++q) bias.data()[q] = q % 2 == 0 ? 4.0f : -2.0f;
  contents.stageBiases.push_back(bias);
  Load(contents);
  std::vector<uint8_t> bytes = TextureBytes(640, 480);
  const Rectangle<float> rect{250.0f, 150.0f, 390.0f, 310.0f};
  std::vector<float> points;
  align68Points(MakeImage(640, 480, bytes), rect, points);
  const std::vector<float> still = StageFreePoints(640, 480, rect, true, MeanShape68(), 100);
  // Moved by the bias in normalised pixels, then back through both scales:
  // the frame here is 280 by 320 pixels of the image.
  const float face = static_cast<int>(static_cast<int>(140 * (250.0f / 280)) * 0.1f * 2 +
                                      static_cast<int>(140 * (250.0f / 280)));
  const float scale = 100.0f / face;
  for (int k = 0; k < 68; ++k) {
    EXPECT_NEAR(points[2 * k] - still[2 * k], 4.0f / scale / (250.0f / 280), 1e-3f) << k;
    EXPECT_NEAR(points[2 * k + 1] - still[2 * k + 1], -2.0f / scale / (250.0f / 320), 1e-3f) << k;
  }
}

TEST_F(AlignmentDriverTest, ResultsAreDeterministicAlsoOnTwoThreads) {
  ModelContents contents = StageFreeModel();
  std::mt19937 generator(8);
  std::uniform_real_distribution<float> value(-0.01f, 0.01f);
  for (int stage = 0; stage < 3; ++stage) {
    mp::pca_map map;
    map.mean = mp::matrix(1, 68 * 128);
    map.projection = mp::matrix(68 * 128, 136);
    for (int64_t i = 0; i < map.projection.size(); ++i) map.projection.data()[i] = value(generator);
    contents.stageMaps.push_back(map);
  }
  contents.stageLevels = {2, 1, 0};
  Load(contents);
  std::vector<uint8_t> bytes = TextureBytes(640, 480);
  const Image image = MakeImage(640, 480, bytes);
  const Rectangle<float> rect{250.0f, 150.0f, 390.0f, 310.0f};
  std::vector<float> first;
  std::vector<float> second;
  align68Points(image, rect, first);
  align68Points(image, rect, second);
  EXPECT_EQ(first, second);
  std::vector<float> a;
  std::vector<float> b;
  std::thread one([&] { align68Points(image, rect, a); });
  std::thread two([&] { align68Points(image, rect, b); });
  one.join();
  two.join();
  EXPECT_EQ(a, first);
  EXPECT_EQ(b, first);
}

}  // namespace
}  // namespace tavilib
