#include "alignment/sdm_regression.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <vector>

#include <opencv2/core.hpp>
#include <opencv2/imgcodecs.hpp>

#include "alignment/alignment_frame.h"
#include "alignment/sdm_model.h"

namespace SDMCore {
namespace {

// Three points in box units.
const std::vector<float> kMean = {0.3f, 0.4f, 0.7f, 0.4f, 0.5f, 0.75f};

// For three points: the identity on the first six feature entries, with the
// given head of the mean, so that a zero feature row gives -meanHead.
mp::pca_map IdentityMap(const std::vector<float>& meanHead) {
  mp::pca_map map;
  map.mean = mp::matrix(1, 3 * 128);
  std::copy(meanHead.begin(), meanHead.end(), map.mean.data());
  map.projection = mp::matrix(3 * 128, 6);
  for (int k = 0; k < 6; ++k) map.projection.data()[k * 6 + k] = 1.0f;
  return map;
}

mp::matrix Row(const std::vector<float>& values) {
  mp::matrix m(1, static_cast<int>(values.size()));
  std::copy(values.begin(), values.end(), m.data());
  return m;
}

cv::Mat Flat(int rows, int cols) { return cv::Mat(rows, cols, CV_8UC1, cv::Scalar(120)); }

// Start 0 is the mean placed in the box; then the mean moved by a tenth of
// the box to (a, b), a the outer loop: point 0 (0.3, 0.4) of a 100 by 80 box
// at (10, 20) lands at (40 + 10a, 52 + 8b).
TEST(StartShapesTest, MeanFirstThenEightMovesColumnMajor) {
  EXPECT_EQ(placeShape({0.0f, 0.0f, 1.0f, 1.0f, 0.5f, 0.25f}, cv::Rect(10, 20, 100, 40)),
            (std::vector<float>{10.0f, 20.0f, 110.0f, 60.0f, 60.0f, 30.0f}));
  const cv::Rect box(10, 20, 100, 80);
  const std::vector<std::vector<float>> starts = startShapes(kMean, box);
  ASSERT_EQ(starts.size(), 9u);
  EXPECT_EQ(starts[0], placeShape(kMean, box));
  const int moves[8][2] = {{-1, -1}, {-1, 0}, {-1, 1}, {0, -1}, {0, 1}, {1, -1}, {1, 0}, {1, 1}};
  for (int s = 1; s < 9; ++s) {
    EXPECT_NEAR(starts[s][0], 40.0f + 10.0f * moves[s - 1][0], 1e-4f) << s;
    EXPECT_NEAR(starts[s][1], 52.0f + 8.0f * moves[s - 1][1], 1e-4f) << s;
  }
}

TEST(PadForShapeTest, FortyPercentOfTheWidthOrWhatAPointOutsideNeeds) {
  const cv::Mat image = Flat(30, 50);
  cv::Mat padded;
  EXPECT_EQ(padForShape(image, {10.0f, 10.0f, 20.0f, 25.0f}, padded), 20);
  EXPECT_EQ(padded.size(), cv::Size(90, 70));
  EXPECT_EQ(padded.at<uint8_t>(19, 19), 0);
  EXPECT_EQ(padded.at<uint8_t>(20, 20), 120);
  EXPECT_EQ(padForShape(image, {-33.5f, 5.0f}, padded), 33);
  EXPECT_EQ(padForShape(image, {5.0f, -21.9f, 1.0f, 1.0f}, padded), 21);
  EXPECT_EQ(padForShape(image, {80.0f, 5.0f}, padded), 31);  // x - columns + 1
  EXPECT_EQ(padForShape(image, {5.0f, 61.0f}, padded), 32);
}

TEST(CoordinateMedianTest, TakesEachCoordinateApartAtPositionHalfN) {
  EXPECT_EQ(coordinateMedian({{1, 9}, {2, 8}, {3, 7}, {4, 6}, {5, 5}, {6, 4}, {7, 3}, {8, 2}, {9, 1}}),
            (std::vector<float>{5, 5}));
  EXPECT_EQ(coordinateMedian({{1, 0}, {4, 3}, {2, 1}, {3, 2}}), (std::vector<float>{3, 2}));
  EXPECT_EQ(coordinateMedian({{0, 10}, {1, 0}, {2, 5}}), (std::vector<float>{1, 5}));
}

// f - mean = (1, -2, 0.5); delta = (1 - 4 + 0, 0.5 + 2 + 2) = (-3, 4.5); a
// bias of another size than the shape is skipped.
TEST(ApplyStageTest, AddsBiasPlusProjectedDifference) {
  mp::pca_map map;
  map.mean = Row({1.0f, 2.0f, 3.0f});
  map.projection = mp::matrix(3, 2);
  const float projection[] = {1.0f, 0.5f, 2.0f, -1.0f, 0.0f, 4.0f};
  std::copy(projection, projection + 6, map.projection.data());
  const float feature[] = {2.0f, 0.0f, 3.5f};
  std::vector<float> shape = {10.0f, 20.0f};
  applyStage(feature, map, Row({0.25f, -0.5f}), shape);
  EXPECT_EQ(shape, (std::vector<float>{10.0f + (0.25f + -3.0f), 20.0f + (-0.5f + 4.5f)}));
  shape = {10.0f, 20.0f};
  applyStage(feature, map, Row({1.0f, 1.0f, 1.0f}), shape);
  EXPECT_EQ(shape, (std::vector<float>{7.0f, 24.5f}));
}

// fitFace scales the unit to the face width (the box's fields truncated),
// regresses there and scales the shape back: with no stages, the median of
// the starts. A stage on a flat image, whose descriptors are all below the
// norm floor, moves every start by bias - mean * P (the feature row is 0), in
// the image padded by 0.4 of its 120 columns; without stage matrices the bias
// is not applied.
TEST(FitFaceTest, RegressesAtTheFaceWidthAndAStageMovesByBiasMinusMean) {
  SDMModel model;
  model.meanShape = kMean;
  model.faceWidth = 60;
  GeneralUnit unit;
  unit.image = Flat(100, 80);
  unit.faceRect = cv::Rect(10, 21, 40, 30);
  const std::vector<float> result = fitFace(model, unit);
  EXPECT_EQ(unit.scale, 1.5f);
  EXPECT_EQ(unit.image.size(), cv::Size(120, 150));
  EXPECT_EQ(unit.faceRect, cv::Rect(15, 31, 60, 45));
  const std::vector<std::vector<float>> starts = startShapes(kMean, unit.faceRect);
  const std::vector<float> median = coordinateMedian(starts);
  for (size_t q = 0; q < median.size(); ++q) EXPECT_EQ(result[q], median[q] / 1.5f) << q;

  model.stageMaps.push_back(IdentityMap({0.5f, -1.0f, 2.0f, 0.0f, -3.0f, 1.5f}));
  model.stageBiases.push_back(Row({1.0f, 1.0f, 1.0f, 1.0f, 1.0f, 1.0f}));
  model.stageMatrices.push_back(mp::matrix(1, 1));
  const float pad = 48.0f;
  const float minusMean[] = {-0.5f, 1.0f, -2.0f, -0.0f, 3.0f, -1.5f};
  const std::vector<float> biased = regressShapes(model, unit.image, starts);
  model.stageMatrices.clear();
  const std::vector<float> unbiased = regressShapes(model, unit.image, starts);
  for (size_t q = 0; q < median.size(); ++q) {
    EXPECT_EQ(biased[q], ((median[q] + pad) + (1.0f + minusMean[q])) - pad) << q;
    EXPECT_EQ(unbiased[q], ((median[q] + pad) + minusMean[q]) - pad) << q;
  }
}

// Texture on the left, flat on the right.
cv::Mat HalfTextured() {
  cv::Mat image(100, 200, CV_8UC1, cv::Scalar(90));
  for (int y = 0; y < 100; ++y) {
    for (int x = 0; x < 80; ++x) image.at<uint8_t>(y, x) = static_cast<uint8_t>((x * 37 + y * 11) % 200);
  }
  return image;
}

// A map that adds the sum of each point's feature block to its x.
mp::pca_map BlockSumMap() {
  mp::pca_map map;
  map.mean = mp::matrix(1, 256);
  map.projection = mp::matrix(256, 4);
  for (int d = 0; d < 256; ++d) map.projection.data()[d * 4 + (d / 128) * 2] = 1.0f;
  return map;
}

// Features are descriptor bytes over 256, so a point moves by a whole number
// of 256ths (exact in floats). Point 1 lies in the flat part and repeats
// point 0's bytes. Stages beyond the level list take its last entry; only the
// levels that stages ask for are blurred.
TEST(RegressShapesTest, FeaturesAreBytesOver256RepeatedWithoutGradientsAtEachStagesLevel) {
  SDMModel model;
  model.meanShape = {0.0f, 0.0f, 0.0f, 0.0f};
  model.stageMaps.push_back(BlockSumMap());
  model.stageLevels = {0};
  std::vector<float> start = {40.0f, 50.0f, 160.0f, 50.0f};
  const std::vector<float> result = regressShapes(model, HalfTextured(), {start});
  const float moved = result[0] - start[0];
  EXPECT_GT(moved, 1.0f);
  EXPECT_EQ(moved * 256.0f, std::floor(moved * 256.0f));
  EXPECT_EQ(result[2] - start[2], moved);
  EXPECT_EQ(result[1], start[1]);
  EXPECT_EQ(result[3], start[3]);

  model.stageMaps.assign(3, BlockSumMap());
  start = {40.0f, 50.0f, 60.0f, 30.0f};
  model.stageLevels = {0, 2, 2};
  const std::vector<float> spelled = regressShapes(model, HalfTextured(), {start});
  model.stageLevels = {0, 2};
  EXPECT_EQ(regressShapes(model, HalfTextured(), {start}), spelled);
  model.stageLevels = {0, 2, 0};
  EXPECT_NE(regressShapes(model, HalfTextured(), {start}), spelled);
  model.stageLevels = {0, 2, 2, 5};
  model.stageMaps.push_back(BlockSumMap());
  model.stageMaps.back().projection.fill(0.0f);
  EXPECT_EQ(regressShapes(model, HalfTextured(), {start}), spelled);
}

// Taking all starts through a stage together must give what taking them one
// by one gives, also where descriptors repeat the buffer: at a later stage
// (point 0 is moved into the flat part by the first stage's bias), and at the
// first stage of a start after the first (point 0 starts in the flat part).
TEST(RegressShapesTest, StartsTakenTogetherEndWhereTakenOneByOne) {
  SDMModel model;
  model.meanShape = {0.0f, 0.0f, 0.0f, 0.0f};
  model.stageMaps.assign(3, BlockSumMap());
  model.stageLevels = {0, 1, 0};
  model.stageBiases = {Row({60.0f, 0.0f, 0.0f, 0.0f}), Row({0, 0, 0, 0}), Row({-60.0f, 0.0f, 0.0f, 0.0f})};
  model.stageMatrices.push_back(mp::matrix(1, 1));
  const cv::Mat image = HalfTextured();
  std::vector<std::vector<float>> starts = {
      {40.0f, 50.0f, 30.0f, 40.0f}, {45.0f, 30.0f, 20.0f, 60.0f}, {50.0f, 70.0f, 60.0f, 20.0f}};
  EXPECT_EQ(regressShapes(model, image, starts), regressShapesOneByOne(model, image, starts));
  // Of two starts the median takes the larger value: start 1's x of point 0.
  starts = {starts[0], {150.0f, 50.0f, 30.0f, 40.0f}};
  EXPECT_EQ(regressShapes(model, image, starts), regressShapesOneByOne(model, image, starts));
}

// The same on a real face with the shipped model, up to the order of
// summation inside the products: within 0.01 pixel.
TEST(RegressShapesTest, StartsTakenTogetherPlaceTheShippedModelsPointsAsOneByOne) {
  SDMModel model;
  ASSERT_TRUE(readSDMModel(TAVI_SOURCE_DIR "/Tavi/public/landmarks.sdm", model));
  const cv::Mat photo = cv::imread(TAVI_SOURCE_DIR "/samples/astronaut.png");
  ASSERT_FALSE(photo.empty());
  for (float shift : {-12.0f, 0.0f, 7.0f}) {
    const tavilib::AlignmentFrame frame =
        tavilib::makeAlignmentFrame(photo, {173.0f + shift, 77.0f, 260.0f + shift, 164.0f - shift});
    GeneralUnit unit;
    unit.image = frame.grey;
    unit.faceRect = frame.faceRect;
    unit.normalize(model.faceWidth);
    const std::vector<std::vector<float>> starts = startShapes(model.meanShape, unit.faceRect);
    const std::vector<float> together = regressShapes(model, unit.image, starts);
    const std::vector<float> oneByOne = regressShapesOneByOne(model, unit.image, starts);
    ASSERT_EQ(together.size(), 136u);
    for (size_t q = 0; q < together.size(); ++q) EXPECT_NEAR(together[q], oneByOne[q], 0.01f) << q;
  }
}

}  // namespace
}  // namespace SDMCore
