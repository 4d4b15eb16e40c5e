#include <gtest/gtest.h>

#include <opencv2/core.hpp>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "alignment/sdm_model.h"
#include "alignment/sdm_regression.h"
#include "detector_training/face_box.h"
#include "detector_training/training_data.h"
#include "landmark_training/landmark_sample.h"
#include "landmark_training/sdm_training.h"
#include "tavilib.h"
#include "temp_dir.h"

namespace landmarks {
namespace {

// Targets exactly bias + (x - 0.5) P, as a stage moves a shape: the fit gives
// P back, its stage reproduces every target, and so do the steps it returns,
// those of the whole fit and those of fits without a row's fold (folds of
// other means, so that the recentring counts).
TEST(FitStageTest, RecoversAnExactlyLinearMapWholeAndWithoutEachFold) {
  const int rows = 400, columns = 12, outputs = 3;
  cv::RNG random(5);
  std::vector<float> features(rows * columns), targets;
  random.fill(cv::Mat(1, rows * columns, CV_32F, features.data()), cv::RNG::UNIFORM, 0.0f, 1.0f);
  for (int r = 0; r < 150; ++r) features[r * columns] += 2.0f;
  mp::pca_map truth;
  truth.mean = mp::matrix(1, columns);
  truth.mean.fill(0.5f);
  truth.projection = mp::matrix(columns, outputs);
  random.fill(cv::Mat(columns, outputs, CV_32F, truth.projection.data()), cv::RNG::UNIFORM, -0.5f, 0.5f);
  mp::matrix bias(1, outputs);
  std::copy_n(std::vector<float>{2.0f, -1.0f, 0.5f}.begin(), 3, bias.data());
  for (int r = 0; r < rows; ++r) {
    std::vector<float> target(outputs);
    SDMCore::applyStage(features.data() + r * columns, truth, bias, target);
    targets.insert(targets.end(), target.begin(), target.end());
  }
  for (const std::vector<size_t>& foldEnds : {std::vector<size_t>{400}, std::vector<size_t>{150, 400}}) {
    mp::pca_map map;
    mp::matrix fittedBias;
    std::vector<float> centred = features;
    const std::vector<float> steps =
        fitStage(centred, targets, foldEnds, columns, outputs, 1e-9, &map, &fittedBias);
    for (int i = 0; i < columns * outputs; ++i) {
      EXPECT_NEAR(map.projection.data()[i], truth.projection.data()[i], 1e-3) << i;
    }
    for (int r = 0; r < rows; r += 7) {
      std::vector<float> shape(outputs);
      SDMCore::applyStage(features.data() + r * columns, map, fittedBias, shape);
      for (int q = 0; q < outputs; ++q) {
        EXPECT_NEAR(shape[q], targets[r * outputs + q], 1e-3) << r;
        EXPECT_NEAR(steps[r * outputs + q], targets[r * outputs + q], 1e-3) << r << " of " << foldEnds.size();
      }
    }
  }
}

// The points go where the pixels under them go, mirrored (with the sides'
// indices swapped) or turned.
TEST(LandmarkSampleTest, PointsFollowTheirPixels) {
  cv::Mat image(60, 80, CV_8UC3, cv::Scalar(0, 0, 0));
  std::vector<float> points(136, 30.0f);
  points[2 * 36] = 20.0f;  // the right eye's outer corner, a bright pixel
  points[2 * 36 + 1] = 25.0f;
  image.at<cv::Vec3b>(25, 20) = cv::Vec3b(255, 255, 255);
  cv::Mat moved;
  std::vector<float> movedPoints;
  mirrorFace(image, points, &moved, &movedPoints);
  EXPECT_EQ(movedPoints[2 * 45], 59.0f);
  EXPECT_EQ(movedPoints[2 * 45 + 1], 25.0f);
  EXPECT_EQ(moved.at<cv::Vec3b>(25, 59)[0], 255);
  rotateFace(image, points, 90.0, &moved, &movedPoints);
  const int x = static_cast<int>(std::lround(movedPoints[2 * 36]));
  const int y = static_cast<int>(std::lround(movedPoints[2 * 36 + 1]));
  EXPECT_GT(moved.at<cv::Vec3b>(y, x)[0], 100) << x << "," << y;
  EXPECT_NE(x, 20);
}

const char kValidationCsv[] = TAVI_SOURCE_DIR "/../shared/data/faces68/val.csv";

// A few held-out faces, prepared from their face boxes.
std::vector<LandmarkSample> RealSamples(size_t count) {
  std::vector<LandmarkSample> samples;
  if (!std::filesystem::exists(kValidationCsv)) return samples;
  for (const training::LabelledFace& face : training::readLabelledFaces(kValidationCsv)) {
    const cv::Mat image = training::readImage(std::filesystem::path(kValidationCsv).parent_path() / face.file);
    const cv::Rect2f box = training::faceBoxFromPoints(face.points);
    std::vector<float> points;
    for (const cv::Point2f& p : face.points) points.insert(points.end(), {p.x, p.y});
    LandmarkSample sample;
    if (makeSample(image, {box.x, box.y, box.br().x, box.br().y}, points, 100, &sample)) samples.push_back(sample);
    if (samples.size() == count) break;
  }
  return samples;
}

TEST(TrainSdmTest, FeaturesAreTheRegressionsOwnAndAStageMovesShapesToTheTruth) {
  const std::vector<LandmarkSample> samples = RealSamples(20);
  if (samples.empty()) GTEST_SKIP() << "no validation data at " << kValidationCsv;
  SdmSettings settings;
  settings.stageLevels = {2};
  settings.ridge = 1e-2;
  std::vector<double> errors;
  const SDMCore::SDMModel model =
      trainSdm(samples, settings, [&](int, double error) { errors.push_back(error); });
  ASSERT_EQ(model.stageMaps.size(), 1u);
  ASSERT_EQ(model.stageMaps[0].projection.rows(), 68 * 128);

  // The model it writes loads as alignment loads it, and moves a start of a
  // face it learnt towards the truth.
  TempDir dir;
  {
    std::ofstream file(dir.path() + "/model.sdm", std::ios::binary);
    ASSERT_TRUE(SDMCore::writeSDMModel(file, model));
  }
  ASSERT_EQ(tavilib::loadSDMModel(dir.path(), "model.sdm"), tavilib::STATUS_OK);
  const SDMCore::SDMModel loaded = *SDMCore::sdmModel;
  tavilib::unloadSDMModel();
  const LandmarkSample& face = samples[3];
  const std::vector<std::vector<float>> starts = SDMCore::startShapes(loaded.meanShape, face.faceRect);
  const double before = normalisedError(starts[1], face.truth);
  const double after = normalisedError(SDMCore::regressShapes(loaded, face.image, {starts[1]}), face.truth);
  EXPECT_LT(after, 0.5 * before);
  EXPECT_LT(errors[0], 0.5 * normalisedError(starts[0], face.truth) + 0.05);

  // A stage whose projection copies 136 chosen feature elements into the
  // shape shows the features the regression computes for a start: they are
  // the ones the trainer computes through FaceFeatures.
  SDMCore::SDMModel probe = loaded;
  probe.stageMatrices.clear();
  probe.stageMaps[0].mean.fill(0.0f);
  probe.stageMaps[0].projection.fill(0.0f);
  for (int q = 0; q < 136; ++q) {
    probe.stageMaps[0].projection.data()[(q * 64 + q % 128) * 136 + q] = 1.0f;
  }
  const std::vector<float> moved = SDMCore::regressShapes(probe, face.image, {starts[0]});
  SDMCore::FaceFeatures features(face.image, starts[0], 3, 2);
  std::vector<float> padded = starts[0];
  for (float& v : padded) v += static_cast<float>(features.pad());
  std::vector<float> row(68 * 128);
  features.compute(padded, 2, row.data());
  for (int q = 0; q < 136; ++q) {
    EXPECT_NEAR(moved[q] - starts[0][q], row[q * 64 + q % 128], 1e-4f) << q;
  }
}

}  // namespace
}  // namespace landmarks
