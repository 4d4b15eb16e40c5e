#include "alignment/sdm_regression.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <vector>

#include <opencv2/core.hpp>

#include "alignment/sdm_model.h"
#include "alignment/sift_pyramid.h"
#include "model_file.h"

namespace SDMCore {
namespace {

// Three points in box units.
const std::vector<float> kMean = {0.3f, 0.4f, 0.7f, 0.4f, 0.5f, 0.75f};

// A map that gives delta[k] = -mean[k] for a zero feature row: the identity
// on the first K feature entries.
mp::pca_map IdentityMap(int points, const std::vector<float>& meanHead) {
  const int D = points * 128;
  const int K = points * 2;
  mp::pca_map map;
  map.mean = mp::matrix(1, D);
  for (size_t i = 0; i < meanHead.size(); ++i) map.mean.data()[i] = meanHead[i];
  map.projection = mp::matrix(D, K);
  for (int k = 0; k < K; ++k) map.projection.data()[k * K + k] = 1.0f;
  return map;
}

mp::matrix Row(const std::vector<float>& values) {
  mp::matrix m(1, static_cast<int>(values.size()));
  std::copy(values.begin(), values.end(), m.data());
  return m;
}

cv::Mat Flat(int rows, int cols) { return cv::Mat(rows, cols, CV_8UC1, cv::Scalar(120)); }

TEST(PlaceShapeTest, BoxUnitsToPixels) {
  const std::vector<float> shape = placeShape({0.0f, 0.0f, 1.0f, 1.0f, 0.5f, 0.25f}, cv::Rect(10, 20, 100, 40));
  EXPECT_EQ(shape, (std::vector<float>{10.0f, 20.0f, 110.0f, 60.0f, 60.0f, 30.0f}));
}

TEST(StartShapesTest, MeanFirstThenEightMovesColumnMajor) {
  const cv::Rect box(10, 20, 100, 80);
  const std::vector<std::vector<float>> starts = startShapes(kMean, box);
  ASSERT_EQ(starts.size(), 9u);
  EXPECT_EQ(starts[0], placeShape(kMean, box));
  const int moves[8][2] = {{-1, -1}, {-1, 0}, {-1, 1}, {0, -1}, {0, 1}, {1, -1}, {1, 0}, {1, 1}};
  for (int s = 1; s < 9; ++s) {
    for (size_t p = 0; p < kMean.size(); p += 2) {
      const float ux = (kMean[p] - 0.5f) * 1.0f + 0.5f + moves[s - 1][0] * 0.1f;
      const float uy = (kMean[p + 1] - 0.5f) * 1.0f + 0.5f + moves[s - 1][1] * 0.1f;
      EXPECT_EQ(starts[s][p], 100.0f * ux + 10.0f) << s;
      EXPECT_EQ(starts[s][p + 1], 80.0f * uy + 20.0f) << s;
    }
  }
  // Start 1 is a tenth of the box to the left and up.
  EXPECT_NEAR(starts[1][0], starts[0][0] - 10.0f, 1e-4f);
  EXPECT_NEAR(starts[1][1], starts[0][1] - 8.0f, 1e-4f);
}

TEST(PadForShapeTest, FloorIsFortyPercentOfTheWidthOnAllSides) {
  const cv::Mat image = Flat(30, 50);
  cv::Mat padded;
  EXPECT_EQ(padForShape(image, {10.0f, 10.0f, 20.0f, 25.0f}, padded), 20);
  EXPECT_EQ(padded.cols, 90);
  EXPECT_EQ(padded.rows, 70);
  EXPECT_EQ(padded.at<uint8_t>(0, 0), 0);
  EXPECT_EQ(padded.at<uint8_t>(20, 20), 120);
}

TEST(PadForShapeTest, PointsOutsideAskForMore) {
  const cv::Mat image = Flat(30, 50);
  cv::Mat padded;
  EXPECT_EQ(padForShape(image, {-33.5f, 5.0f}, padded), 33);
  EXPECT_EQ(padForShape(image, {5.0f, -21.9f, 1.0f, 1.0f}, padded), 21);
  // Beyond the right edge: x - columns + 1.
  EXPECT_EQ(padForShape(image, {80.0f, 5.0f}, padded), 31);
  EXPECT_EQ(padForShape(image, {5.0f, 61.0f}, padded), 32);
  EXPECT_EQ(padded.rows, 30 + 64);
  // A small image may need no padding at all: used as it is.
  const cv::Mat tiny = Flat(2, 2);
  EXPECT_EQ(padForShape(tiny, {1.0f, 1.0f}, padded), 0);
  EXPECT_EQ(padded.data, tiny.data);
}

TEST(CoordinateMedianTest, TakesEachCoordinateApart) {
  const std::vector<std::vector<float>> shapes = {{1, 9}, {2, 8}, {3, 7}, {4, 6}, {5, 5},
                                                  {6, 4}, {7, 3}, {8, 2}, {9, 1}};
  EXPECT_EQ(coordinateMedian(shapes), (std::vector<float>{5, 5}));
  // An even count takes the upper middle: position n / 2.
  EXPECT_EQ(coordinateMedian({{1, 0}, {4, 3}, {2, 1}, {3, 2}}), (std::vector<float>{3, 2}));
  // The median shape may mix shapes.
  EXPECT_EQ(coordinateMedian({{0, 10}, {1, 0}, {2, 5}}), (std::vector<float>{1, 5}));
}

TEST(ApplyStageTest, AddsBiasPlusProjectedDifference) {
  // D = 3, K = 2: delta = (f - mean) * P.
  mp::pca_map map;
  map.mean = Row({1.0f, 2.0f, 3.0f});
  map.projection = mp::matrix(3, 2);
  const float projection[] = {1.0f, 0.5f, 2.0f, -1.0f, 0.0f, 4.0f};
  std::copy(projection, projection + 6, map.projection.data());
  const float feature[] = {2.0f, 0.0f, 3.5f};
  // f - mean = (1, -2, 0.5); delta = (1 - 4 + 0, 0.5 + 2 + 2) = (-3, 4.5).
  std::vector<float> shape = {10.0f, 20.0f};
  applyStage(feature, map, Row({0.25f, -0.5f}), shape);
  EXPECT_EQ(shape, (std::vector<float>{10.0f + (0.25f + -3.0f), 20.0f + (-0.5f + 4.5f)}));
  // A bias of another size is skipped.
  shape = {10.0f, 20.0f};
  applyStage(feature, map, Row({1.0f, 1.0f, 1.0f}), shape);
  EXPECT_EQ(shape, (std::vector<float>{7.0f, 24.5f}));
  shape = {10.0f, 20.0f};
  applyStage(feature, map, mp::matrix(), shape);
  EXPECT_EQ(shape, (std::vector<float>{7.0f, 24.5f}));
}

TEST(RegressShapesTest, WithoutStagesTheResultIsTheMedianOfTheStarts) {
  SDMModel model;
  model.meanShape = kMean;
  const cv::Mat image = Flat(120, 100);
  const std::vector<std::vector<float>> starts = startShapes(kMean, cv::Rect(20, 30, 60, 60));
  EXPECT_EQ(regressShapes(model, image, starts), coordinateMedian(starts));
}

TEST(RegressShapesTest, OneStageOnAFlatImageMovesByBiasMinusMean) {
  // On a flat image every descriptor is below the norm floor, the buffer keeps
  // its zeros, and the feature row is 0: delta = -mean * P.
  SDMModel model;
  model.meanShape = kMean;
  model.stageMaps.push_back(IdentityMap(3, {0.5f, -1.0f, 2.0f, 0.0f, -3.0f, 1.5f}));
  model.stageBiases.push_back(Row({1.0f, 1.0f, 1.0f, 1.0f, 1.0f, 1.0f}));
  model.stageMatrices.push_back(mp::matrix(1, 1));
  model.stageLevels = {1};
  const cv::Mat image = Flat(120, 100);
  const std::vector<float> start = {30.0f, 40.0f, 60.0f, 40.0f, 45.0f, 70.0f};
  const float pad = 40.0f;
  const std::vector<float> result = regressShapes(model, image, {start});
  const float minusMean[] = {-0.5f, 1.0f, -2.0f, -0.0f, 3.0f, -1.5f};
  for (size_t q = 0; q < start.size(); ++q) {
    EXPECT_EQ(result[q], (start[q] + pad) + (1.0f + minusMean[q]) - pad) << q;
  }
  // Without stage matrices the bias is not applied.
  model.stageMatrices.clear();
  const std::vector<float> unbiased = regressShapes(model, image, {start});
  for (size_t q = 0; q < start.size(); ++q) {
    EXPECT_EQ(unbiased[q], (start[q] + pad) + minusMean[q] - pad) << q;
  }
}

TEST(RegressShapesTest, AStageRunsOnEveryStartBeforeTheMedian) {
  SDMModel model;
  model.meanShape = kMean;
  model.stageMaps.push_back(IdentityMap(3, {-2.0f, -2.0f, -2.0f, -2.0f, -2.0f, -2.0f}));
  model.stageMaps.push_back(IdentityMap(3, {-1.0f, -1.0f, -1.0f, -1.0f, -1.0f, -1.0f}));
  const cv::Mat image = Flat(120, 100);
  const std::vector<std::vector<float>> starts = startShapes(kMean, cv::Rect(20, 30, 60, 60));
  std::vector<std::vector<float>> moved = starts;
  for (std::vector<float>& shape : moved) {
    for (float& v : shape) v = ((v + 40.0f) + 2.0f + 1.0f) - 40.0f;
  }
  EXPECT_EQ(regressShapes(model, image, starts), coordinateMedian(moved));
}

TEST(RegressShapesTest, APointWithoutGradientsRepeatsThePreviousDescriptor) {
  // Texture on the left, flat on the right: point 1 lies in the flat part, so
  // its feature block repeats point 0's bytes. The map sums each point's block
  // into its x update.
  cv::Mat image(100, 200, CV_8UC1, cv::Scalar(90));
  for (int y = 0; y < 100; ++y) {
    for (int x = 0; x < 80; ++x) image.at<uint8_t>(y, x) = static_cast<uint8_t>((x * 37 + y * 11) % 200);
  }
  SDMModel model;
  model.meanShape = {0.0f, 0.0f, 0.0f, 0.0f};
  mp::pca_map map;
  map.mean = mp::matrix(1, 256);
  map.projection = mp::matrix(256, 4);
  for (int d = 0; d < 256; ++d) map.projection.data()[d * 4 + (d / 128) * 2] = 1.0f;
  model.stageMaps.push_back(map);
  model.stageLevels = {0};
  const std::vector<float> start = {40.0f, 50.0f, 160.0f, 50.0f};
  const std::vector<float> result = regressShapes(model, image, {start});

  // Point 0's descriptor on the padded image, as the regression sees it.
  cv::Mat padded;
  const int pad = padForShape(image, start, padded);
  SiftPyramid pyramid(padded.cols, padded.rows, 3);
  pyramid.buildBase(padded.cols, padded.rows, padded.ptr<uint8_t>(0));
  pyramid.buildLevels();
  uint8_t bytes[128] = {};
  float norm = 0;
  pyramid.computeDescriptor(start[0] + pad, start[1] + pad, 0.0f, norm, bytes);
  ASSERT_GT(norm, 0.5f);
  float blockSum = 0;
  for (uint8_t b : bytes) blockSum += b * 0.00390625f;
  ASSERT_GT(blockSum, 0.0f);
  EXPECT_EQ(result[0], (start[0] + pad + blockSum) - pad);
  EXPECT_EQ(result[2], (start[2] + pad + blockSum) - pad);
  EXPECT_EQ(result[1], start[1]);
  EXPECT_EQ(result[3], start[3]);
}

TEST(FitFaceTest, NormalisesToTheFaceWidthAndRestores) {
  SDMModel model;
  model.meanShape = kMean;
  model.faceWidth = 50;
  GeneralUnit unit;
  unit.image = Flat(250, 250);
  unit.faceRect = cv::Rect(60, 70, 120, 110);
  const std::vector<float> result = fitFace(model, unit);
  const float scale = 50.0f / 120.0f;
  EXPECT_EQ(unit.scale, scale);
  EXPECT_EQ(unit.image.cols, static_cast<int>(250 * scale));
  EXPECT_EQ(unit.faceRect, cv::Rect(static_cast<int>(60 * scale), static_cast<int>(70 * scale),
                                    static_cast<int>(120 * scale), static_cast<int>(110 * scale)));
  std::vector<float> expected = coordinateMedian(startShapes(kMean, unit.faceRect));
  for (float& v : expected) v /= scale;
  EXPECT_EQ(result, expected);
  EXPECT_EQ(unit.resultShape, expected);
}

TEST(FitFaceTest, UsesTheProcessWideModel) {
  SDMModel model;
  model.meanShape = kMean;
  SDMModel* const saved = sdmModel;
  sdmModel = &model;
  GeneralUnit unit;
  unit.image = Flat(250, 250);
  unit.faceRect = cv::Rect(50, 50, 100, 100);
  GeneralUnit copy = unit;
  copy.image = unit.image.clone();
  const std::vector<float> global = fitFace(unit);
  sdmModel = saved;
  EXPECT_EQ(global, fitFace(model, copy));
}

#if defined(__GNUC__) && defined(__x86_64__)
TEST(GeneralUnitTest, VirtualOperationsStandInTheirSlotOrder) {
  // Itanium ABI: 1 + the byte offset of the slot.
  auto slot = [](auto f) {
    ptrdiff_t raw;
    std::memcpy(&raw, &f, sizeof raw);
    return (raw - 1) / static_cast<ptrdiff_t>(sizeof(void*));
  };
  EXPECT_EQ(slot(&GeneralUnit::normalize), 0);
  EXPECT_EQ(slot(&GeneralUnit::normalizeImage), 1);
  EXPECT_EQ(slot(&GeneralUnit::scaleFaceRect), 2);
  EXPECT_EQ(slot(&GeneralUnit::restoreShapes), 3);
}
#endif

TEST(GeneralUnitTest, NormalizeScalesImageShapesAndBox) {
  GeneralUnit unit;
  unit.image = cv::Mat(100, 80, CV_8UC1, cv::Scalar(7));
  unit.faceRect = cv::Rect(10, 21, 40, 30);
  unit.referenceShape = {4.0f, 8.0f};
  unit.resultShape = {2.0f, 6.0f};
  unit.normalize(60);
  EXPECT_EQ(unit.scale, 1.5f);
  EXPECT_EQ(unit.image.size(), cv::Size(120, 150));
  EXPECT_EQ(unit.faceRect, cv::Rect(15, 31, 60, 45));
  EXPECT_EQ(unit.referenceShape, (std::vector<float>{6.0f, 12.0f}));
  EXPECT_EQ(unit.resultShape, (std::vector<float>{3.0f, 9.0f}));
  unit.restoreShapes();
  EXPECT_EQ(unit.resultShape, (std::vector<float>{2.0f, 6.0f}));
  EXPECT_EQ(unit.referenceShape, (std::vector<float>{4.0f, 8.0f}));
}

}  // namespace
}  // namespace SDMCore
