#include "detector/window_grading.h"

#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>

#include <cmath>

#include <opencv2/imgcodecs.hpp>

#include "detector/cascade_files.h"
#include "detector/cascade_loader.h"
#include "test_cascade.h"

namespace tavilib {
namespace {

using namespace testing_cascade;

CascadeStage ConstantStage(const std::vector<float>& logits) {
  CascadeStage stage;
  stage.net.reset(new nn::Net<float>(ConstantWindowText(static_cast<int>(logits.size())),
                                     nn::NetDescription::kText));
  stage.net->CopyTrainedLayersFrom(ConstantWindowWeights(logits));
  return stage;
}

CascadeStage CalibrationStage(int favouredClass, size_t tableRows = 19) {
  CascadeStage stage = ConstantStage(FavourClass(19, favouredClass));
  TempDir dir;
  stage.offsetsScales = readOffsetsScales(dir.write("offsets", DefaultOffsetsScales()));
  stage.offsetsScales.resize(tableRows);
  return stage;
}

Window At(int x, int y, int side) { return Window{x, y, side, side, 0.7f, 3}; }

TEST(WindowGradingTest, GradingReplacesScoresAndKeepsTheList) {
  CascadeStage stage = ConstantStage({0.0f, 2.0f});
  stage.mean.assign(1728, 128.0f);
  const cv::Mat image(100, 120, CV_8UC3, cv::Scalar::all(50));
  const std::vector<Window> graded = gradeWindows({At(0, 0, 30), At(70, 40, 50)}, stage, image);
  ASSERT_EQ(graded.size(), 2u);
  EXPECT_FLOAT_EQ(graded[0].score, 1.0f / (1.0f + std::exp(-2.0f)));
  EXPECT_EQ(graded[1].x, 70);
  EXPECT_EQ(graded[1].level, 3);

  // Nine windows, eight of them in one pass: each is normalised over all
  // three classes.
  CascadeStage three = ConstantStage({0.0f, 2.0f, 1.0f});
  three.mean.assign(1728, 128.0f);
  for (const Window& window : gradeWindows(std::vector<Window>(9, At(0, 0, 30)), three, image)) {
    EXPECT_FLOAT_EQ(window.score, std::exp(2.0f) / (1.0f + std::exp(2.0f) + std::exp(1.0f)));
  }

  EXPECT_THROW(gradeWindows({At(90, 0, 40)}, stage, image), cv::Exception)
      << "a window that leaves the image";
}

TEST(WindowGradingTest, TheNetSeesPlanesInByteOrderTwoOneZeroLessTheMean) {
  // The face logit is 0.05 times the average of plane 0 less its mean.
  CascadeStage stage;
  stage.net.reset(new nn::Net<float>(ConstantWindowText(2), nn::NetDescription::kText));
  nn::NetParameter weights = ConstantWindowWeights({0.0f, 0.0f});
  for (int i = 0; i < 576; ++i) {
    weights.mutable_layers(0)->mutable_blobs(0)->set_data(1728 + i, 0.05f / 576.0f);
  }
  stage.net->CopyTrainedLayersFrom(weights);
  // A mean of 200 in plane 0 only: the third byte of a pixel.
  stage.mean.assign(1728, 0.0f);
  std::fill(stage.mean.begin(), stage.mean.begin() + 576, 200.0f);

  cv::Mat image(48, 48, CV_8UC3, cv::Scalar(0, 0, 200));
  EXPECT_NEAR(gradeWindows({At(0, 0, 48)}, stage, image)[0].score, 0.5f, 1e-6);
  image.setTo(cv::Scalar(200, 0, 0));
  EXPECT_LT(gradeWindows({At(0, 0, 48)}, stage, image)[0].score, 0.01f);
}

TEST(WindowGradingTest, CalibrationShiftsAndScalesByTheBestClass) {
  const cv::Mat image(200, 200, CV_8UC3, cv::Scalar::all(0));
  // Class 4: offset (4, 0), scale 1, so x moves left by trunc(4 / 24 * 48) = 8.
  CascadeStage left = CalibrationStage(4);
  std::vector<Window> moved = calibrateWindows({At(100, 50, 48), At(7, 50, 48)}, left, image);
  EXPECT_EQ(moved[0].x, 92);
  EXPECT_EQ(moved[0].y, 50);
  EXPECT_EQ(moved[0].score, 0.7f);
  EXPECT_EQ(moved[1].x, 7) << "x would become -1: the window stays whole";

  // Class 2: offset (-4, 0) moves right; touching the right edge is refused.
  CascadeStage right = CalibrationStage(2);
  moved = calibrateWindows({At(143, 0, 48), At(144, 0, 48)}, right, image);
  EXPECT_EQ(moved[0].x, 151);
  EXPECT_EQ(moved[1].x, 144) << "152 is columns minus width: not strictly inside";

  // Class 9: offset (1, 1), scale 11/12 enlarges: 48 / 0.9166667 = 52.36.
  CascadeStage larger = CalibrationStage(9);
  moved = calibrateWindows({At(100, 100, 48)}, larger, image);
  EXPECT_EQ(moved[0].x, 98);
  EXPECT_EQ(moved[0].y, 98);
  EXPECT_EQ(moved[0].width, 52);
  EXPECT_EQ(moved[0].height, 52);

  CascadeStage still = CalibrationStage(0);
  EXPECT_EQ(calibrateWindows({At(10, 10, 48)}, still, image)[0].x, 10);
}

TEST(WindowGradingTest, CalibrationNeedsAClaimOfOneInTenWithinTheTable) {
  const cv::Mat image(200, 200, CV_8UC3, cv::Scalar::all(0));
  // Nineteen equal logits: every class at 1/19.
  CascadeStage undecided = ConstantStage(std::vector<float>(19, 0.0f));
  TempDir dir;
  undecided.offsetsScales = readOffsetsScales(dir.write("offsets", DefaultOffsetsScales()));
  EXPECT_EQ(calibrateWindows({At(100, 100, 48)}, undecided, image)[0].x, 100);

  // The favoured class 4 lies beyond a table of four rows.
  CascadeStage shortTable = CalibrationStage(4, 4);
  EXPECT_EQ(calibrateWindows({At(100, 100, 48)}, shortTable, image)[0].x, 100);

  // Corrections no integer holds (a scale of 0 or a tiny one, offsets near
  // 2^31) cannot land inside the image: the window stays, whole.
  for (const OffsetScale& wild : {OffsetScale{0, 0, 0.0f}, OffsetScale{0, 0, 1e-30f},
                                  OffsetScale{2000000000, 0, 1.0f},
                                  OffsetScale{0, -2147483647, 1.0f}}) {
    CascadeStage table = CalibrationStage(4);
    table.offsetsScales[4] = wild;
    const Window moved = calibrateWindows({At(100, 100, 48)}, table, image)[0];
    EXPECT_EQ(moved.x, 100);
    EXPECT_EQ(moved.y, 100);
    EXPECT_EQ(moved.width, 48);
    EXPECT_EQ(moved.height, 48);
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
  calibration.offsetsScales = readOffsetsScales(root + "x32Net-x32-3Scales-200/offsets-scales");
  const std::vector<Window> together = calibrateWindows(windows, calibration, photo);
  for (size_t i = 0; i < windows.size(); ++i) {
    const Window alone = calibrateWindows({windows[i]}, calibration, photo)[0];
    EXPECT_EQ(cv::Rect(together[i].x, together[i].y, together[i].width, together[i].height),
              cv::Rect(alone.x, alone.y, alone.width, alone.height)) << i;
  }
}

}  // namespace
}  // namespace tavilib
