#include <gtest/gtest.h>

#include <limits>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <opencv2/core.hpp>

#include "alignment/alignment_frame.h"
#include "alignment/sdm_model.h"
#include "alignment/sdm_regression.h"
#include "tavilib.h"
#include "temp_dir.h"

namespace tavilib {
namespace {

// 68 points on a grid inside the face box and random stage maps, so that the
// points are no regular grid.
SDMCore::SDMModel RandomModel(int stages) {
  SDMCore::SDMModel model;
  for (int i = 0; i < 68; ++i) {
    model.meanShape.push_back(0.15f + 0.1f * (i % 8));
    model.meanShape.push_back(0.1f + 0.09f * (i / 8));
  }
  cv::RNG generator(stages);
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

class AlignmentDriverTest : public testing::Test {
 protected:
  void TearDown() override { unloadSDMModel(); }

  Status Load(const SDMCore::SDMModel& model) {
    std::ostringstream bytes;
    SDMCore::writeSDMModel(bytes, model);
    dir_.write("model.bin", bytes.str());
    return loadSDMModel(dir_.path(), "model.bin");
  }

  TempDir dir_;
  std::vector<uint8_t> bytes_ = std::vector<uint8_t>(320 * 240 * 3);
  const Image image_{320, 240, 0, bytes_.data()};
};

// Without a model, after a failed load (which drops the earlier model), and
// with a model that would take alignment outside its arrays, alignment
// reports the failed load and leaves no points. Rectangles that would divide
// by zero or cast what no int holds, and an empty image, are refused; one
// wholly outside the image or inverted meets the image library's range check.
TEST_F(AlignmentDriverTest, RefusesUnsafeModelsAndUnusableInputs) {
  const Rectangle<float> rect{100, 60, 200, 170};
  std::vector<float> points(3);
  EXPECT_EQ(align68Points(image_, rect, points), STATUS_MODEL_LOAD_FAILED);
  EXPECT_TRUE(points.empty());
  SDMCore::SDMModel safe = RandomModel(2);
  safe.stageLevels = {0, 5};  // the top level of three scales an octave
  ASSERT_EQ(Load(safe), STATUS_OK);
  EXPECT_EQ(align68Points(image_, rect, points), STATUS_OK);
  EXPECT_EQ(points.size(), 136u);
  EXPECT_EQ(loadSDMModel(dir_.path(), "absent.bin"), STATUS_MODEL_LOAD_FAILED);
  points.assign(10, 1.0f);
  EXPECT_EQ(align5Points(image_, rect, points), STATUS_MODEL_LOAD_FAILED);
  EXPECT_TRUE(points.empty());
  std::vector<SDMCore::SDMModel> unsafe(6, RandomModel(1));
  unsafe[0].scalesPerOctave = -2;
  unsafe[1].stageLevels = {6};
  unsafe[2].stageMaps[0].projection = mp::matrix(68 * 128, 100);
  unsafe[3].stageMaps[0].mean = mp::matrix(1, 60 * 128);
  // Found by fuzzing: a point of the mean shape at 1e25 box sizes padded the
  // image by more than an int holds; a NaN in a map would do the same later.
  unsafe[4].meanShape[7] = 1e25f;
  const float nan = std::numeric_limits<float>::quiet_NaN();
  unsafe[5].stageMaps[0].projection.data()[1000] = nan;
  for (const SDMCore::SDMModel& model : unsafe) {
    ASSERT_EQ(Load(model), STATUS_MODEL_LOAD_FAILED);  // aligning with it would crash
    EXPECT_EQ(align68Points(image_, rect, points), STATUS_MODEL_LOAD_FAILED);
  }

  ASSERT_EQ(Load(RandomModel(0)), STATUS_OK);
  const float inf = std::numeric_limits<float>::infinity();
  using Rect = Rectangle<float>;
  for (const Rect& bad : {Rect{nan, 50, 150, 150}, Rect{50, 50, inf, 150}, Rect{-1e30f, -1e30f, 1e30f, 1e30f},
                          Rect{80, 80, 80, 150}}) {
    EXPECT_THROW(align68Points(image_, bad, points), std::invalid_argument) << bad.left << " " << bad.right;
  }
  EXPECT_THROW(align68Points(Image{0, 0, 0, bytes_.data()}, {0, 0, 10, 10}, points), std::invalid_argument);
  EXPECT_THROW(align68Points(image_, {400, 400, 450, 450}, points), cv::Exception);
  EXPECT_THROW(align68Points(image_, {100, 100, 60, 60}, points), cv::Exception);
}

// The 68 points are the fit in the frame taken back to the image, with the
// rows read tightly packed whatever the stride says; results repeat, also on
// two threads at once. The five points are the means of the listed groups.
TEST_F(AlignmentDriverTest, PointsAreTheFrameFitInImagePixelsAndFivePointsTheListedMeans) {
  ASSERT_EQ(Load(RandomModel(2)), STATUS_OK);
  cv::randu(cv::Mat(1, static_cast<int>(bytes_.size()), CV_8U, bytes_.data()), 0, 256);
  const Rectangle<float> rect{100.5f, 60, 200, 170.25f};
  SDMCore::GeneralUnit unit;
  const AlignmentFrame frame = makeAlignmentFrame(cv::Mat(240, 320, CV_8UC3, bytes_.data()), rect);
  unit.image = frame.grey;
  unit.faceRect = frame.faceRect;
  const std::vector<float> expected = frameToImage(frame, SDMCore::fitFace(unit));
  std::vector<float> all, strided, five;
  std::thread one([&] { EXPECT_EQ(align68Points(image_, rect, all), STATUS_OK); });
  std::thread two([&] { align68Points(Image{320, 240, 1000, bytes_.data()}, rect, strided); });
  one.join();
  two.join();
  EXPECT_EQ(all, expected);
  EXPECT_EQ(strided, expected);

  EXPECT_EQ(align5Points(image_, rect, five), STATUS_OK);
  ASSERT_EQ(five.size(), 10u);
  const std::vector<std::vector<int>> groups = {{36, 37, 38, 39, 40, 41}, {42, 43, 44, 45, 46, 47}, {30}, {48}, {54}};
  for (size_t g = 0; g < groups.size(); ++g) {
    float x = 0, y = 0;
    for (int i : groups[g]) x += all[2 * i], y += all[2 * i + 1];
    EXPECT_EQ(five[2 * g], x / groups[g].size()) << g;
    EXPECT_EQ(five[2 * g + 1], y / groups[g].size()) << g;
  }
}

}  // namespace
}  // namespace tavilib
