#include <gtest/gtest.h>

#include <opencv2/core.hpp>

#include <cmath>
#include <functional>
#include <random>
#include <string>
#include <vector>

#include "detector/cascade_net_texts.h"
#include "detector/default_cascade_tables.h"
#include "detector/image_planes.h"
#include "detector/window_grading.h"
#include "detector_training/face_box.h"
#include "detector_training/net_trainer.h"
#include "detector_training/training_data.h"
#include "detector_training/window_sampler.h"
#include "nn/net.h"
#include "nn/util/io.h"
#include "temp_dir.h"

namespace training {
namespace {

// A face 80 wide, brows at 20 and chin at 140: the box is 120 on a side,
// centred on x 50 and y 80.
TEST(FaceBoxTest, SquareFromBrowTopToLowestPointCentredOnThePoints) {
  std::vector<cv::Point2f> points(68, cv::Point2f(50.0f, 60.0f));
  points[0] = {10.0f, 70.0f};
  points[16] = {90.0f, 70.0f};
  points[8] = {50.0f, 140.0f};
  points[19] = {30.0f, 20.0f};
  points[30] = {50.0f, 5.0f};  // above the brows, but no brow: ignored for the top
  const cv::Rect2f box = faceBoxFromPoints(points);
  EXPECT_EQ(box, cv::Rect2f(-10.0f, 20.0f, 120.0f, 120.0f));
  EXPECT_FLOAT_EQ(intersectionOverUnion(box, box), 1.0f);
  EXPECT_FLOAT_EQ(intersectionOverUnion(box, cv::Rect2f(-10, 20, 60, 120)), 0.5f);
}

// A calibration net that always answers class `answer`.
tavilib::CascadeStage FixedCalibration(int answer) {
  const std::string text = R"(
    input: "data" input_dim: 1 input_dim: 3 input_dim: 24 input_dim: 24
    layers { name: "fcf" type: INNER_PRODUCT bottom: "data" top: "fcf"
             inner_product_param { num_output: 19 } }
    layers { name: "probs" type: SOFTMAX bottom: "fcf" top: "probs" })";
  tavilib::CascadeStage stage;
  stage.net.reset(new nn::Net<float>(text, nn::NetDescription::kText));
  float* bias = stage.net->layers()[0]->blobs()[1]->mutable_cpu_data();
  std::fill_n(bias, 19, 0.0f);
  bias[answer] = 50.0f;
  const tavilib::DefaultCascadeTables tables;
  for (size_t i = 0; i < tables.offsetsX.size(); ++i) {
    stage.offsetsScales.push_back({tables.offsetsX[i], tables.offsetsY[i], static_cast<float>(tables.scales[i])});
  }
  return stage;
}

TEST(CalibrationSquareTest, TheDetectorsCorrectionOfEachClassBringsItsSquareBackToTheFace) {
  const cv::Mat image(400, 400, CV_8UC3, cv::Scalar(0, 0, 0));
  const cv::Rect2f face(150.0f, 140.0f, 96.0f, 96.0f);
  for (int k = 0; k < 19; ++k) {
    tavilib::CascadeStage calibration = FixedCalibration(k);
    const cv::Rect2f square = calibrationSquare(face, calibration.offsetsScales[k], 24);
    auto round = [](float v) { return static_cast<int>(std::lround(v)); };
    const tavilib::Window window{round(square.x), round(square.y), round(square.width), round(square.height), 0.9f, 0};
    const tavilib::Window back = tavilib::calibrateWindows({window}, calibration, image)[0];
    EXPECT_NEAR(back.x, face.x, 1.5) << "class " << k;
    EXPECT_NEAR(back.y, face.y, 1.5) << "class " << k;
    EXPECT_NEAR(back.width, face.width, 1.5) << "class " << k;
    // Every class but the first moves its window.
    EXPECT_EQ(k == 0, window.x == back.x && window.y == back.y && window.width == back.width) << k;
  }
}

// The message of the DataError that action throws, or "" when none.
std::string DataErrorOf(const std::function<void()>& action) {
  try {
    action();
  } catch (const DataError& error) {
    return error.what();
  }
  return "";
}

// A missing folder, an image that does not decode, a field that is no number
// and a line short of fields are refused, naming the file (and the line).
TEST(TrainingDataTest, RefusesMissingFilesAndBadLinesNamingFileAndLine) {
  TempDir dir;
  EXPECT_NE(DataErrorOf([&] { loadTrainingData(dir.path() + "/"); }).find("/faces68/train.csv"), std::string::npos);
  const std::string broken = dir.write("broken.jpg", "not an image");
  EXPECT_NE(DataErrorOf([&] { readImage(broken); }).find(broken), std::string::npos);
  std::string header = "file,person";
  std::string line = "images/a.jpg,a";
  for (int p = 0; p < 68; ++p) {
    header += ",x" + std::to_string(p) + ",y" + std::to_string(p);
    line += ",1,2";
  }
  const std::string good = header + "\n" + line + "\n";
  EXPECT_EQ(readLabelledFaces(dir.write("good.csv", good)).at(0).points.at(67), cv::Point2f(1, 2));
  const std::string bad = dir.write("bad.csv", good + line.substr(0, line.size() - 1) + "x\n");
  EXPECT_EQ(DataErrorOf([&] { readLabelledFaces(bad); }).find(bad + ":3:"), 0u);
  const std::string cut = dir.write("short.csv", header + "\nimages/a.jpg,a,1\n");
  EXPECT_EQ(DataErrorOf([&] { readLabelledFaces(cut); }).find(cut + ":2:"), 0u);
}

// Bright squares in the middle against noise: a problem the scan net must
// learn in a few epochs.
WindowSet SquaresAndNoise(unsigned seed) {
  std::mt19937 random(seed);
  WindowSet set;
  for (int i = 0; i < 512; ++i) {
    cv::Mat window(12, 12, CV_8UC3);
    cv::randu(window, cv::Scalar::all(0), cv::Scalar::all(120));
    const int label = i % 2;
    if (label == 1) {
      const int x = 3 + static_cast<int>(random() % 3);
      window(cv::Rect(x, 3, 5, 6)).setTo(cv::Scalar::all(200 + static_cast<int>(random() % 50)));
    }
    set.add(window, label);
  }
  return set;
}

// The stage's deploy description declared at an input of width by height.
nn::NetParameter Declared(const char* text, int width, int height) {
  nn::NetParameter description;
  nn::ReadNetParamsFromText(text, &description);
  description.set_input_dim(2, height);
  description.set_input_dim(3, width);
  return description;
}

void FillRandom(nn::Blob<float>& blob, uint64_t seed, float low, float high) {
  cv::RNG(seed).fill(cv::Mat(1, blob.count(), CV_32F, blob.mutable_cpu_data()), cv::RNG::UNIFORM, low, high);
}

TEST(NetTrainerTest, LearnsAndExportsAScanNetWhoseStoredResponseVanishes) {
  NetTrainingSettings settings;
  settings.batch = 32;
  settings.baseLr = 0.02f;
  NetTrainer trainer(tavilib::kStage0NetText, 12, true, settings, std::vector<float>(432, 100.0f));
  const WindowSet train = SquaresAndNoise(1);
  for (int epoch = 0; epoch < 6; ++epoch) trainer.trainEpoch(train, epoch);
  const WindowSet test = SquaresAndNoise(2);
  const std::vector<std::vector<float>> probabilities = trainer.probabilities(test);
  ASSERT_EQ(probabilities.size(), test.size());
  int right = 0;
  for (size_t i = 0; i < test.size(); ++i) right += (probabilities[i][1] > 0.5f) == (test.labels[i] == 1);
  EXPECT_GT(right, 500);

  // Deployed at 60 by 60 and primed, the net at a smaller pyramid size gives
  // the map of a plain net declared at that size: the flat correction added
  // to the first convolution is zero.
  nn::Net<float> primed(Declared(tavilib::kStage0NetText, 60, 60));
  nn::Net<float> plain(Declared(tavilib::kStage0NetText, 30, 41));
  primed.CopyTrainedLayersFrom(trainer.deployWeights());
  plain.CopyTrainedLayersFrom(trainer.deployWeights());
  primed.FirstRun();
  primed.AlterInputShape(30, 41);
  cv::Mat level(41, 30, CV_8UC3);
  cv::randu(level, cv::Scalar::all(0), cv::Scalar::all(256));
  for (nn::Net<float>* net : {&primed, &plain}) {
    tavilib::writeImagePlanes(level, net->net_input_blobs()[0]->mutable_cpu_data(), 3 * 41 * 30);
  }
  const nn::Blob<float>& fromPrimed = *primed.FF()[0];
  const nn::Blob<float>& fromPlain = *plain.Forward()[0];
  ASSERT_EQ(fromPrimed.count(), fromPlain.count());
  for (int i = 0; i < fromPlain.count(); ++i) {
    EXPECT_NEAR(fromPrimed.cpu_data()[i], fromPlain.cpu_data()[i], 1e-5f) << i;
  }
}

TEST(NetTrainerTest, RaisingTheFaceLogitMovesEveryProbabilityByTheSameOdds) {
  const double shift = logOdds(0.98f) - logOdds(0.95f);
  EXPECT_NEAR(shift, 0.9474, 1e-4);
  // A grader's one probability, and every cell of the scan net's map.
  for (const bool scan : {false, true}) {
    const char* text = scan ? tavilib::kStage0NetText : tavilib::kStage1NetText;
    const int side = scan ? 12 : 24;
    NetTrainer trainer(text, side, scan, NetTrainingSettings(),
                       std::vector<float>(3 * side * side, 0.0f));
    nn::NetParameter weights = trainer.deployWeights();
    nn::Net<float> before(Declared(text, 24, 24));
    nn::Net<float> after(Declared(text, 24, 24));
    before.CopyTrainedLayersFrom(weights);
    raiseFaceLogit(weights, shift);
    after.CopyTrainedLayersFrom(weights);
    for (int trial = 0; trial < 5; ++trial) {
      FillRandom(*before.net_input_blobs()[0], trial + 1, -100.0f, 100.0f);
      FillRandom(*after.net_input_blobs()[0], trial + 1, -100.0f, 100.0f);
      const nn::Blob<float>& p = *before.Forward()[0];
      const nn::Blob<float>& raised = *after.Forward()[0];
      const int cells = p.count() / 2;
      EXPECT_EQ(cells, scan ? 9 : 1);
      for (int cell = cells; cell < 2 * cells; ++cell) {
        EXPECT_NEAR(logOdds(raised.cpu_data()[cell]), logOdds(p.cpu_data()[cell]) + shift, 1e-3)
            << scan << " " << trial << " " << cell;
      }
    }
  }
}

}  // namespace
}  // namespace training
