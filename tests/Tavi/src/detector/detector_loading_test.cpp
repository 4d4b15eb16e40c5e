#include <gtest/gtest.h>

#include <filesystem>
#include <string>

#include "detector/detector_state.h"
#include "nn/engine.h"
#include "test_cascade.h"

namespace tavilib {
namespace {

using namespace testing_cascade;

const CascadeParameter kParams{1.0f, 400, 0.125f, 3, 1.5f, 12};

TEST(DetectorLoadingTest, AFolderLoadsWithCommentsAndBuildsTheStagesInOrder) {
  TempDir dir;
  TestModelFolder folder(dir);
  folder.addScanStage("scan", 200);
  folder.addConstantStage("grade", {0.0f, 3.0f});
  folder.addCalibration(0);
  folder.writeList("# the scan first\nscan 0.5\n# then a grader\ngrade 0.8\n");
  Detector detector;
  ASSERT_EQ(detector.load(folder.params()), STATUS_OK);
  EXPECT_EQ(nn::Engine::phase(), nn::Engine::TEST);
  EXPECT_EQ(nn::Engine::mode(), nn::Engine::CPU);

  const auto& state = *static_cast<const DetectorState*>(detector.getDetector());
  ASSERT_EQ(state.stages.size(), 2u);
  EXPECT_EQ(state.stages[0].threshold, 0.5f);
  EXPECT_TRUE(state.stages[0].mean.empty()) << "the full form has no mean";
  EXPECT_EQ(state.stages[1].threshold, 0.8f);
  EXPECT_EQ(state.stages[1].mean.size(), 1728u);
  EXPECT_EQ(state.calibration.offsetsScales.size(), 19u);
  EXPECT_TRUE(state.ready);
}

TEST(DetectorLoadingTest, MissingOrEmptyListsLeaveAFailedState) {
  TempDir dir;
  TestModelFolder folder(dir);
  folder.addScanStage("scan", 200);
  folder.addCalibration(0);
  cv::Mat pixels = ImageWithPatch(100, 80, cv::Rect(10, 10, 20, 20));
  std::vector<Detection> detections(1);

  for (const char* list : {"", "# only comments\n# here\n", "scan 0.5"}) {
    folder.writeList(list);
    Detector detector;
    EXPECT_EQ(detector.load(folder.params()), STATUS_MODEL_LOAD_FAILED) << list;
    EXPECT_TRUE(detector.is_loaded());
    EXPECT_EQ(detect(AsImage(pixels), detector, detections, kParams), STATUS_DETECTOR_NOT_READY);
    EXPECT_EQ(detections.size(), 1u);
  }

  // A second load drops a working state before it fails.
  Detector detector;
  folder.writeList("scan 0.5\n");
  ASSERT_EQ(loadDetector(detector, folder.params()), STATUS_OK);
  ASSERT_EQ(detect(AsImage(pixels), detector, detections, kParams), STATUS_OK);
  EXPECT_EQ(loadDetector(detector, DetectorParams()), STATUS_MODEL_LOAD_FAILED);
  EXPECT_EQ(detect(AsImage(pixels), detector, detections, kParams), STATUS_DETECTOR_NOT_READY);
  unloadDetector(detector);
  EXPECT_FALSE(detector.is_loaded());
}

TEST(DetectorLoadingDeathTest, MissingOrEmptyNetFilesEndTheProcessNamingTheFile) {
  TempDir dir;
  TestModelFolder folder(dir);
  folder.addScanStage("scan", 200);
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

}  // namespace
}  // namespace tavilib
