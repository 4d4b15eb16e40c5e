#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <limits>
#include <string>
#include <stdexcept>
#include <thread>
#include <vector>

#include <opencv2/core.hpp>
#include <opencv2/imgproc.hpp>

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

std::vector<uint8_t> NoiseBytes(int width, int height, uint64_t seed) {
  std::vector<uint8_t> bytes(static_cast<size_t>(width) * height * 3);
  cv::RNG(seed).fill(cv::Mat(1, static_cast<int>(bytes.size()), CV_8U, bytes.data()), cv::RNG::UNIFORM, 0, 256);
  return bytes;
}

// A model without stages gives the median of the nine starts, which depends on
// the geometry only.
ModelContents StageFreeModel() {
  ModelContents model;
  model.meanShape = MeanShape68();
  return model;
}

// A model of 68 points with random stage maps, so that the points are not a
// regular grid.
ModelContents RandomStagesModel(int stages, uint64_t seed) {
  ModelContents model = StageFreeModel();
  cv::RNG generator(seed);
  for (int stage = 0; stage < stages; ++stage) {
    mp::pca_map map;
    map.mean = mp::matrix(1, 68 * 128);
    map.projection = mp::matrix(68 * 128, 136);
    generator.fill(cv::Mat(1, 68 * 128, CV_32F, map.mean.data()), cv::RNG::UNIFORM, 0.0, 0.04);
    generator.fill(cv::Mat(68 * 128, 136, CV_32F, map.projection.data()), cv::RNG::UNIFORM, -0.02, 0.02);
    model.stageMaps.push_back(map);
  }
  return model;
}

// The driver's geometry for a stage-free model, step by step: crop, working
// frame, face box, enlargement, normalisation, starts, median, and back.
std::vector<float> StageFreePoints(int width, int height, Rectangle<float> rect, bool crop) {
  float left = rect.left, top = rect.top, right = rect.right, bottom = rect.bottom;
  const float w = right - left;
  const float h = bottom - top;
  float cropX = 0, cropY = 0;
  int columns = width, rows = height;
  if (crop) {
    cropX = std::max(left - w * 0.5f, 0.0f);
    cropY = std::max(top - h * 0.5f, 0.0f);
    float regionRight = right + w * 0.5f;
    if (!(static_cast<float>(width) > regionRight)) regionRight = static_cast<float>(width - 1);
    float regionBottom = bottom + h * 0.5f;
    if (!(static_cast<float>(height) > regionBottom)) regionBottom = static_cast<float>(height - 1);
    columns = static_cast<int>(regionRight - cropX);
    rows = static_cast<int>(regionBottom - cropY);
    left -= cropX, right -= cropX, top -= cropY, bottom -= cropY;
  }
  const float scaleX = columns != 250 || rows != 250 ? 250.0f / columns : 1.0f;
  const float scaleY = columns != 250 || rows != 250 ? 250.0f / rows : 1.0f;
  left *= scaleX, right *= scaleX, top *= scaleY, bottom *= scaleY;
  const int boxX = static_cast<int>(left);
  const int boxY = static_cast<int>(top);
  const int boxW = static_cast<int>(right - left);
  const int boxH = static_cast<int>(bottom - top);
  const float a = boxW * 0.1f;
  const float b = boxH * 0.15f;
  cv::Rect face(static_cast<int>(boxX - static_cast<double>(a) * 0.5), static_cast<int>(boxY + b),
                static_cast<int>(a + a + boxW), static_cast<int>(b + b + boxH));
  const float scale = 100.0f / static_cast<float>(face.width);
  face = cv::Rect(static_cast<int>(face.x * scale), static_cast<int>(face.y * scale),
                  static_cast<int>(face.width * scale), static_cast<int>(face.height * scale));
  // The regression pads the normalised frame and takes the padding off again.
  std::vector<std::vector<float>> starts = SDMCore::startShapes(MeanShape68(), face);
  cv::Mat padded;
  const float pad = static_cast<float>(SDMCore::padForShape(
      cv::Mat(static_cast<int>(250 * scale), static_cast<int>(250 * scale), CV_8UC1), starts[0], padded));
  for (std::vector<float>& start : starts) {
    for (float& v : start) v += pad;
  }
  const std::vector<float> shape = SDMCore::coordinateMedian(starts);
  std::vector<float> points(136);
  for (int k = 0; k < 68; ++k) {
    points[2 * k] = ((shape[2 * k] - pad) / scale) / scaleX + cropX;
    points[2 * k + 1] = ((shape[2 * k + 1] - pad) / scale) / scaleY + cropY;
  }
  return points;
}

class AlignmentDriverTest : public testing::Test {
 protected:
  void TearDown() override { unloadSDMModel(); }

  void Load(const ModelContents& model) {
    dir_.write("model.bin", ModelBytes(model));
    ASSERT_EQ(loadSDMModel(dir_.path(), "model.bin"), STATUS_OK);
  }

  TempDir dir_;
};

// Crops of a small rectangle, clipped at the left or bottom right edge; the
// crop test on a halved odd width (101 / 2 = 50: a width of 50 is not
// smaller, 49.5 is, and a height below half crops whatever the width); and a
// 250 by 250 image with no crop, which is not resized.
TEST_F(AlignmentDriverTest, StageFreeModelGivesTheMedianStartInImagePixels) {
  Load(StageFreeModel());
  std::vector<uint8_t> bytes = NoiseBytes(640, 480, 4);
  const struct {
    int width, height;
    Rectangle<float> rect;
    bool crop;
  } cases[] = {{640, 480, {200.5f, 150.25f, 330, 290.75f}, true}, {640, 480, {-30, 10, 90, 120}, true},
               {640, 480, {560, 380, 650, 470}, true},                {250, 250, {60, 70, 190, 200}, false},
               {101, 300, {20, 40, 70, 200}, false},                  {101, 300, {20, 40, 69.5f, 200}, true},
               {101, 300, {20, 40, 70, 180}, true}};
  for (const auto& c : cases) {
    std::vector<float> points(3, 7.0f);
    EXPECT_EQ(align68Points(Image{c.width, c.height, 0, bytes.data()}, c.rect, points), STATUS_OK);
    EXPECT_EQ(points, StageFreePoints(c.width, c.height, c.rect, c.crop)) << c.width << " " << c.rect.right;
    EXPECT_NE(points, StageFreePoints(c.width, c.height, c.rect, !c.crop)) << c.width << " " << c.rect.right;
  }
}

TEST_F(AlignmentDriverTest, RectangleWhollyOutsideOrInvertedRaisesTheImageLibrarysError) {
  Load(StageFreeModel());
  std::vector<uint8_t> bytes = NoiseBytes(200, 200, 5);
  const Image image{200, 200, 0, bytes.data()};
  std::vector<float> points;
  EXPECT_THROW(align68Points(image, Rectangle<float>{400, 400, 450, 450}, points), cv::Exception);
  EXPECT_THROW(align68Points(image, Rectangle<float>{100, 100, 60, 60}, points), cv::Exception);
}

// Models that would take alignment outside its arrays do not load; inputs
// that would divide by zero or cast what no int holds are refused.
TEST_F(AlignmentDriverTest, UnsafeModelsAndInputsAreRefused) {
  std::vector<uint8_t> bytes = NoiseBytes(200, 200, 5);
  const Image image{200, 200, 0, bytes.data()};
  std::vector<float> points;
  std::vector<ModelContents> unsafe(6, RandomStagesModel(1, 9));
  unsafe[0].scalesPerOctave = -2;
  unsafe[1].stageLevels = {9};
  unsafe[2].stageMaps[0].projection = mp::matrix(68 * 128, 100);
  unsafe[3].stageMaps[0].mean = mp::matrix(1, 60 * 128);
  // Found by fuzzing: a point of the mean shape at 1e25 box sizes padded the
  // image by more than an int holds; a NaN in a map would do the same later.
  unsafe[4].meanShape[7] = 1e25f;
  unsafe[5].stageMaps[0].projection.data()[1000] = std::numeric_limits<float>::quiet_NaN();
  for (const ModelContents& model : unsafe) {
    dir_.write("unsafe.bin", ModelBytes(model));
    EXPECT_EQ(loadSDMModel(dir_.path(), "unsafe.bin"), STATUS_MODEL_LOAD_FAILED);
    EXPECT_EQ(align68Points(image, Rectangle<float>{50, 50, 150, 150}, points), STATUS_MODEL_LOAD_FAILED);
  }

  Load(StageFreeModel());
  const float nan = std::numeric_limits<float>::quiet_NaN();
  const float inf = std::numeric_limits<float>::infinity();
  for (const Rectangle<float>& rect : {Rectangle<float>{nan, 50, 150, 150},
                                       Rectangle<float>{50, 50, inf, 150},
                                       Rectangle<float>{-1e30f, -1e30f, 1e30f, 1e30f},
                                       Rectangle<float>{80, 80, 80, 150}}) {
    EXPECT_THROW(align68Points(image, rect, points), std::invalid_argument) << rect.left;
  }
  EXPECT_THROW(align68Points(Image{0, 0, 0, bytes.data()}, Rectangle<float>{0, 0, 10, 10}, points),
               std::invalid_argument);
}

TEST_F(AlignmentDriverTest, FivePointsAreTheListedMeans) {
  Load(RandomStagesModel(1, 6));
  std::vector<uint8_t> bytes = NoiseBytes(320, 240, 6);
  const Image image{320, 240, 0, bytes.data()};
  const Rectangle<float> rect{100.0f, 60.0f, 200.0f, 170.0f};
  std::vector<float> all;
  align68Points(image, rect, all);
  std::vector<float> five(1, 0.0f);
  EXPECT_EQ(align5Points(image, rect, five), STATUS_OK);
  ASSERT_EQ(five.size(), 10u);
  const std::vector<std::vector<int>> groups = {
      {36, 37, 38, 39, 40, 41}, {42, 43, 44, 45, 46, 47}, {30}, {48}, {54}};
  for (size_t g = 0; g < groups.size(); ++g) {
    float x = 0, y = 0;
    for (int i : groups[g]) x += all[2 * i], y += all[2 * i + 1];
    EXPECT_EQ(five[2 * g], x / groups[g].size()) << g;
    EXPECT_EQ(five[2 * g + 1], y / groups[g].size()) << g;
  }
}

// Rows are read tightly packed whatever the stride says, and the grey image
// weighs the first byte as red (code 7), as the models are trained: a colour
// image aligns as its grey copy does. (A 250 by 250 image without a crop is
// not resized, which would round the two apart.) Results repeat, also on two
// threads at once.
TEST_F(AlignmentDriverTest, PackedColourIsReadAsRedFirstGreyAndResultsRepeatOnTwoThreads) {
  ModelContents contents = RandomStagesModel(2, 8);
  contents.stageLevels = {2, 0};
  Load(contents);
  std::vector<uint8_t> bytes = NoiseBytes(250, 250, 7);
  cv::Mat grey, replicated;
  cv::cvtColor(cv::Mat(250, 250, CV_8UC3, bytes.data()), grey, cv::COLOR_RGB2GRAY);
  cv::cvtColor(grey, replicated, cv::COLOR_GRAY2RGB);
  const Rectangle<float> rect{60, 70, 190, 200};
  std::vector<float> expected, a, b;
  align68Points(Image{250, 250, 0, replicated.data}, rect, expected);
  std::thread one([&] { align68Points(Image{250, 250, 0, bytes.data()}, rect, a); });
  std::thread two([&] { align68Points(Image{250, 250, 1000, bytes.data()}, rect, b); });
  one.join();
  two.join();
  EXPECT_EQ(a, expected);
  EXPECT_EQ(b, expected);
}

}  // namespace
}  // namespace tavilib
