#include <gtest/gtest.h>

#include <cmath>
#include <filesystem>
#include <limits>
#include <stdexcept>
#include <vector>

#include "detector/detector_state.h"
#include "nn/engine.h"
#include "test_cascade.h"

namespace tavilib {
namespace {

using namespace testing_cascade;

// The base image is 0.24 of the input, and a level-0 window 50 input pixels.
const CascadeParameter kParams{1.0f, 400, 0.125f, 3, 1.5f, 12};

// Loads the test folder's scan stage, a grader of face logit 3, a last stage
// of 4 and a calibration net that always picks calibrationClass.
Status Load(Detector& detector, const TempDir& dir, const std::string& list, int calibrationClass) {
  TestModelFolder folder(dir);
  folder.addScanStage("scan");
  folder.addConstantStage("grade", {0.0f, 3.0f});
  folder.addConstantStage("final", {0.0f, 4.0f});
  folder.addCalibration(calibrationClass);
  folder.writeList(list);
  return detector.load(folder.params());
}

// Lists naming no stage, and a second load that fails after a working one,
// leave a state that refuses to detect.
TEST(DetectorLoadingTest, MissingOrEmptyListsLeaveAFailedState) {
  TempDir dir;
  cv::Mat pixels = ImageWithPatch(100, 80, cv::Rect(10, 10, 20, 20));
  std::vector<Detection> detections(1);
  for (const char* list : {"", "# only comments\n# here\n", "scan 0.5"}) {
    Detector detector;
    EXPECT_EQ(Load(detector, dir, list, 0), STATUS_MODEL_LOAD_FAILED) << list;
    EXPECT_TRUE(detector.is_loaded());
    EXPECT_EQ(detect(AsImage(pixels), detector, detections, kParams), STATUS_DETECTOR_NOT_READY);
    EXPECT_EQ(detections.size(), 1u);
  }
  Detector detector;
  ASSERT_EQ(Load(detector, dir, "scan 0.5\n", 0), STATUS_OK);
  ASSERT_EQ(detect(AsImage(pixels), detector, detections, kParams), STATUS_OK);
  EXPECT_EQ(loadDetector(detector, DetectorParams()), STATUS_MODEL_LOAD_FAILED);
  EXPECT_EQ(detect(AsImage(pixels), detector, detections, kParams), STATUS_DETECTOR_NOT_READY);
  unloadDetector(detector);
  EXPECT_FALSE(detector.is_loaded());
}

TEST(DetectorLoadingDeathTest, MissingOrEmptyNetFilesEndTheProcessNamingTheFile) {
  TempDir dir;
  TestModelFolder folder(dir);
  folder.addScanStage("scan");
  folder.writeList("scan 0.5\n");
  Detector detector;
  EXPECT_DEATH(detector.load(folder.params()),
               "File not found: .*/cascades/x32Net-x32-3Scales-200/+prototxt-deploy");
  folder.addCalibration(0);
  folder.writeList("scan 0.5\nnowhere 0.5\n");
  EXPECT_DEATH(detector.load(folder.params()), "File not found: .*/nowhere/prototxt-deploy");

  // An empty description, a folder in its place, or a list line cut by a NUL
  // byte (naming the model folder itself) give a net without input.
  folder.writeList("scan 0.5\n");
  dir.write(kCalibrationFolder + "/prototxt-deploy", "");
  EXPECT_DEATH(detector.load(folder.params()), "x32Net-x32-3Scales-200/+prototxt-deploy");
  std::filesystem::create_directories(dir.path() + "/folder/prototxt-full");
  folder.writeList("folder 0.5\n");
  EXPECT_DEATH(detector.load(folder.params()), "/folder/prototxt-full");
  folder.writeList(std::string("folder\0/scan 0.5\n", 17));
  EXPECT_DEATH(detector.load(folder.params()), "/folder");
}

TEST(DetectTest, FindsABrightPatchThroughAnyStrideAppendsAndRefusesWhatIsOutsideTheContract) {
  TempDir dir;
  Detector detector;
  ASSERT_EQ(Load(detector, dir, "scan 0.5\n", 0), STATUS_OK);
  const cv::Rect patch(200, 100, 60, 60);
  cv::Mat pixels = ImageWithPatch(400, 300, patch);
  std::vector<Detection> detections;
  ASSERT_EQ(detect(AsImage(pixels), detector, detections, kParams), STATUS_OK);
  ASSERT_FALSE(detections.empty());
  for (size_t i = 0; i < detections.size(); ++i) {
    const Rectangle<float>& box = detections[i].box;
    EXPECT_TRUE(box.left < patch.x + patch.width && patch.x < box.right &&
                box.top < patch.y + patch.height && patch.y < box.bottom);
    EXPECT_GT(detections[i].score, 0.5f);
    EXPECT_EQ(box.right - box.left, box.bottom - box.top);
    EXPECT_GE(detections[i > 0 ? i - 1 : 0].score, detections[i].score);
  }

  // The same rows behind a stride with white padding: the same list, appended.
  cv::Mat padded(300, 400 * 3 + 13, CV_8UC1, cv::Scalar::all(255));
  pixels.copyTo(cv::Mat(300, 400, CV_8UC3, padded.data, padded.step));
  const size_t first = detections.size();
  ASSERT_EQ(detect(Image{400, 300, 400 * 3 + 13, padded.data}, detector, detections, kParams), STATUS_OK);
  ASSERT_EQ(detections.size(), 2 * first);
  for (size_t i = 0; i < first; ++i) {
    const Detection& a = detections[i];
    const Detection& b = detections[first + i];
    EXPECT_TRUE(a.box.left == b.box.left && a.box.top == b.box.top && a.score == b.score) << i;
  }

  // Images, strides and scan settings a host can get wrong are refused before
  // any buffer is written.
  EXPECT_THROW(detect(Image{40, 30, 0, nullptr}, detector, detections, kParams), cv::Exception);
  EXPECT_THROW(detect(Image{0, 30, 0, pixels.data}, detector, detections, kParams), cv::Exception);
  for (int32_t stride : {-1200, 5, 1199}) {
    EXPECT_THROW(detect(Image{400, 300, stride, pixels.data}, detector, detections, kParams),
                 std::invalid_argument) << stride;
  }
  const float nan = std::numeric_limits<float>::quiet_NaN();
  const CascadeParameter wrong[] = {
      {1.0f, 0, 0.125f, 3, 1.5f, 12},   {1.0f, 400, 0.0f, 3, 1.5f, 12},
      {1.0f, 400, nan, 3, 1.5f, 12},    {1.0f, 400, 1e-9f, 3, 1.5f, 12},
      {1.0f, 400, 1e30f, 3, 1.5f, 12},  {1.0f, 400, 0.125f, 3, nan, 12},
      {1.0f, 400, 0.125f, 3, 1.0f, 12}, {1.0f, 400, 0.125f, 3, 1.5f, 0},
      {0.0f, 400, 0.125f, 3, 1.5f, 12},
      // A base image of 1200 by 900 against the scan net's 200 by 200.
      {1.0f, 400, 0.01f, 3, 1.5f, 12}};
  for (const CascadeParameter& params : wrong) {
    EXPECT_THROW(detect(AsImage(pixels), detector, detections, params), std::invalid_argument)
        << params.normalizedSize << " " << params.minFaceRatio << " " << params.scaleStep;
  }
  EXPECT_EQ(detections.size(), 2 * first);
}

TEST(DetectTest, AFolderLoadsItsStagesInOrderAndCalibratesTheMiddleOne) {
  // One pyramid level, so that every window is 50 pixels wide and calibration
  // class 4 moves it left by trunc(4 / 24 * 50) = 8.
  CascadeParameter oneLevel = kParams;
  oneLevel.numScales = 1;
  cv::Mat pixels = ImageWithPatch(400, 300, cv::Rect(200, 100, 60, 60));
  std::vector<Detection> found[2];
  for (int calibrationClass : {0, 4}) {
    TempDir dir;
    Detector detector;
    ASSERT_EQ(Load(detector, dir, "# the scan first\nscan 0.5\n# then graders\ngrade 0.8\nfinal 0.9\n",
                   calibrationClass), STATUS_OK);
    EXPECT_EQ(nn::Engine::phase(), nn::Engine::TEST);
    EXPECT_EQ(nn::Engine::mode(), nn::Engine::CPU);
    const auto& state = *static_cast<const DetectorState*>(detector.getDetector());
    ASSERT_EQ(state.stages.size(), 3u);
    EXPECT_EQ(state.stages[1].threshold, 0.8f);
    EXPECT_TRUE(state.stages[0].mean.empty()) << "the full form has no mean";
    EXPECT_EQ(state.stages[2].mean.size(), 1728u);
    EXPECT_EQ(state.calibration.offsetsScales.size(), 19u);
    ASSERT_EQ(detect(AsImage(pixels), detector, found[calibrationClass / 4], oneLevel), STATUS_OK);
  }
  const std::vector<Detection>& unmoved = found[0];
  const std::vector<Detection>& moved = found[1];
  ASSERT_FALSE(unmoved.empty());
  ASSERT_EQ(moved.size(), unmoved.size());
  for (size_t i = 0; i < moved.size(); ++i) {
    EXPECT_EQ(moved[i].box.left, unmoved[i].box.left - 8);
    EXPECT_EQ(moved[i].box.top, unmoved[i].box.top);
    EXPECT_FLOAT_EQ(moved[i].score, 1.0f / (1.0f + std::exp(-4.0f))) << "the last stage's score";
  }
}

}  // namespace
}  // namespace tavilib
