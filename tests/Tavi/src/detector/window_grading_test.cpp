#include "detector/window_grading.h"

#include <gtest/gtest.h>

#include <cmath>

#include <opencv2/imgcodecs.hpp>

#include "detector/cascade_files.h"
#include "detector/cascade_loader.h"
#include "detector/image_planes.h"
#include "nn/net.h"
#include "test_cascade.h"

namespace tavilib {
namespace {

using namespace testing_cascade;

// A stage of fixed logits, with the shipped calibration table.
CascadeStage ConstantStage(const std::vector<float>& logits, nn::NetParameter weights = {}) {
  CascadeStage stage;
  stage.net.reset(new nn::Net<float>(ConstantWindowText(static_cast<int>(logits.size())),
                                     nn::NetDescription::kText));
  if (weights.layers_size() == 0) weights.ParseFromString(ConstantWindowWeights(logits));
  stage.net->CopyTrainedLayersFrom(weights);
  stage.offsetsScales = readOffsetsScales(kShippedOffsets);
  return stage;
}

Window At(int x, int y, int side) { return Window{x, y, side, side, 0.7f, 3}; }

TEST(WindowGradingTest, GradingReplacesScoresWithTheFaceClassOfPlanesLessTheMean) {
  CascadeStage stage = ConstantStage({0.0f, 2.0f});
  const cv::Mat image(100, 120, CV_8UC3, cv::Scalar::all(50));
  const std::vector<Window> graded = gradeWindows({At(0, 0, 30), At(70, 40, 50)}, stage, image);
  ASSERT_EQ(graded.size(), 2u);
  EXPECT_FLOAT_EQ(graded[0].score, 1.0f / (1.0f + std::exp(-2.0f)));
  EXPECT_EQ(graded[1].x, 70);
  EXPECT_EQ(graded[1].level, 3);

  // Nine windows, eight of them in one pass: each is normalised over all
  // three classes.
  CascadeStage three = ConstantStage({0.0f, 2.0f, 1.0f});
  for (const Window& window : gradeWindows(std::vector<Window>(9, At(0, 0, 30)), three, image)) {
    EXPECT_FLOAT_EQ(window.score, std::exp(2.0f) / (1.0f + std::exp(2.0f) + std::exp(1.0f)));
  }

  EXPECT_THROW(gradeWindows({At(90, 0, 40)}, stage, image), cv::Exception)
      << "a window that leaves the image";

  // The net sees planes of the third, second and first byte, less the mean.
  const cv::Mat pixels = (cv::Mat_<cv::Vec3b>(1, 2) << cv::Vec3b(1, 2, 3), cv::Vec3b(4, 5, 6));
  std::vector<float> planes(6);
  writeImagePlanes(pixels, planes.data(), 6);
  EXPECT_EQ(planes, (std::vector<float>{3, 6, 2, 5, 1, 4}));

  // The face logit is 0.05 times the average of plane 0 less its mean of 200.
  nn::NetParameter weights;
  weights.ParseFromString(ConstantWindowWeights({0.0f, 0.0f}));
  for (int i = 0; i < 576; ++i) {
    weights.mutable_layers(0)->mutable_blobs(0)->set_data(1728 + i, 0.05f / 576.0f);
  }
  CascadeStage planeZero = ConstantStage({0.0f, 0.0f}, weights);
  planeZero.mean.assign(1728, 0.0f);
  std::fill(planeZero.mean.begin(), planeZero.mean.begin() + 576, 200.0f);
  cv::Mat square(48, 48, CV_8UC3, cv::Scalar(0, 0, 200));
  EXPECT_NEAR(gradeWindows({At(0, 0, 48)}, planeZero, square)[0].score, 0.5f, 1e-6);
  square.setTo(cv::Scalar(200, 0, 0));
  EXPECT_LT(gradeWindows({At(0, 0, 48)}, planeZero, square)[0].score, 0.01f);
}

// Calibrates `in` on a 200 x 200 image with a net of fixed logits, against
// the shipped table cut to `rows` rows and with row `row` replaced if given.
cv::Rect Calibrate(const std::vector<float>& logits, const cv::Rect& in, size_t rows = 19,
                   int row = -1, const OffsetScale& correction = {}) {
  static const cv::Mat image(200, 200, CV_8UC3, cv::Scalar::all(0));
  CascadeStage stage = ConstantStage(logits);
  stage.offsetsScales.resize(rows);
  if (row >= 0) stage.offsetsScales[row] = correction;
  const Window moved = calibrateWindows({Window{in.x, in.y, in.width, in.height, 0.7f, 3}}, stage, image)[0];
  EXPECT_EQ(moved.score, 0.7f);
  return cv::Rect(moved.x, moved.y, moved.width, moved.height);
}

TEST(WindowGradingTest, CalibrationMovesStrictlyInsideByAClaimOfOneInTenWithinTheTable) {
  // Class 4 is offset (4, 0): x moves left by trunc(4 / 24 * 48) = 8. Class 2
  // (-4, 0) moves right, but not onto the right edge. Class 9, (1, 1) at
  // scale 11/12, enlarges 48 to 52.
  const struct { int favoured; cv::Rect in, out; } cases[] = {
      {4, {100, 50, 48, 48}, {92, 50, 48, 48}},  {4, {7, 50, 48, 48}, {7, 50, 48, 48}},
      {2, {143, 0, 48, 48}, {151, 0, 48, 48}},   {2, {144, 0, 48, 48}, {144, 0, 48, 48}},
      {9, {100, 100, 48, 48}, {98, 98, 52, 52}}, {0, {10, 10, 48, 48}, {10, 10, 48, 48}}};
  for (const auto& c : cases) {
    EXPECT_EQ(Calibrate(Favour(c.favoured), c.in), c.out) << c.favoured << " " << c.in;
  }
  // Ten equal classes claim one in ten each, and the first moves; nineteen
  // claim too little. Class 4 lies beyond a table of four rows.
  const cv::Rect at(100, 100, 48, 48);
  EXPECT_EQ(Calibrate(std::vector<float>(10, 0.0f), at, 19, 0, {4, 0, 1.0f}), cv::Rect(92, 100, 48, 48));
  EXPECT_EQ(Calibrate(std::vector<float>(19, 0.0f), at, 19, 0, {4, 0, 1.0f}), at);
  EXPECT_EQ(Calibrate(Favour(4), at, 4), at);
  // Corrections no integer holds (a scale of 0 or a tiny one, offsets near
  // 2^31) cannot land inside the image: the window stays, whole.
  for (const OffsetScale& wild : {OffsetScale{0, 0, 0.0f}, OffsetScale{0, 0, 1e-30f},
                                  OffsetScale{2000000000, 0, 1.0f}, OffsetScale{0, -2147483647, 1.0f}}) {
    EXPECT_EQ(Calibrate(Favour(4), at, 19, 4, wild), at);
  }
}

// The shipped nets take windows eight at a time where eight are left; each
// window must come out as it does alone: scores within 1e-6, the same moves.
TEST(WindowGradingTest, WindowsTakenTogetherComeOutAsAlone) {
  const cv::Mat photo = cv::imread(TAVI_SOURCE_DIR "/samples/astronaut.png");
  ASSERT_FALSE(photo.empty());
  std::vector<Window> windows;
  for (int i = 0; i < 19; ++i) windows.push_back(At(150 + 7 * i, 60 + 5 * (i % 4), 80 + 9 * (i % 5)));
  const std::string root = TAVI_SOURCE_DIR "/Tavi/public/cascades/";
  for (const char* folder : {"x32Net", "x64Net"}) {
    CascadeStage stage = loadDeployStage(root + folder);
    const std::vector<Window> together = gradeWindows(windows, stage, photo);
    for (size_t i = 0; i < windows.size(); ++i) {
      EXPECT_NEAR(together[i].score, gradeWindows({windows[i]}, stage, photo)[0].score, 1e-6) << folder << i;
    }
  }
  CascadeStage calibration = loadDeployStage(root + "x32Net-x32-3Scales-200");
  calibration.offsetsScales = readOffsetsScales(kShippedOffsets);
  const std::vector<Window> together = calibrateWindows(windows, calibration, photo);
  for (size_t i = 0; i < windows.size(); ++i) {
    const Window alone = calibrateWindows({windows[i]}, calibration, photo)[0];
    EXPECT_EQ(cv::Rect(together[i].x, together[i].y, together[i].width, together[i].height),
              cv::Rect(alone.x, alone.y, alone.width, alone.height)) << i;
  }
}

}  // namespace
}  // namespace tavilib
