#include <gtest/gtest.h>
#include <unistd.h>

#include <climits>
#include <filesystem>
#include <string>

#include "detector/cascade_net_texts.h"
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
  folder.addConstantStage("grade", 3.0f);
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

  Detector detector;
  EXPECT_EQ(loadDetector(detector, DetectorParams()), STATUS_MODEL_LOAD_FAILED);
  EXPECT_TRUE(detector.is_loaded());

  // A second load drops a working state before it fails.
  folder.writeList("scan 0.5\n");
  ASSERT_EQ(loadDetector(detector, folder.params()), STATUS_OK);
  ASSERT_EQ(detect(AsImage(pixels), detector, detections, kParams), STATUS_OK);
  folder.writeList("# nothing\n");
  EXPECT_EQ(loadDetector(detector, folder.params()), STATUS_MODEL_LOAD_FAILED);
  EXPECT_EQ(detect(AsImage(pixels), detector, detections, kParams), STATUS_DETECTOR_NOT_READY);
  unloadDetector(detector);
  EXPECT_FALSE(detector.is_loaded());
}

TEST(DetectorLoadingDeathTest, MissingNetFilesEndTheProcess) {
  TempDir dir;
  TestModelFolder folder(dir);
  folder.addScanStage("scan", 200);
  folder.writeList("scan 0.5\nnowhere 0.5\n");
  folder.addCalibration(0);
  Detector detector;
  EXPECT_DEATH(detector.load(folder.params()), "File not found: .*/nowhere/prototxt-deploy");

  TempDir bare;
  TestModelFolder noCalibration(bare);
  noCalibration.addScanStage("scan", 200);
  noCalibration.writeList("scan 0.5\n");
  EXPECT_DEATH(detector.load(noCalibration.params()),
               "File not found: .*/cascades/x32Net-x32-3Scales-200//prototxt-deploy");

  // An empty description, a folder in its place, or a list line cut by a NUL
  // byte (naming the model folder itself) give a net without input.
  folder.writeList("scan 0.5\n");
  dir.write("cascades/x32Net-x32-3Scales-200/prototxt-deploy", "");
  EXPECT_DEATH(detector.load(folder.params()),
               "Net description .*/cascades/x32Net-x32-3Scales-200//prototxt-deploy has no input "
               "or no \"probs\" blob.");
  std::filesystem::create_directories(dir.path() + "/folder/prototxt-full");
  folder.writeList("folder 0.5\n");
  EXPECT_DEATH(detector.load(folder.params()),
               "Net description .*/folder/prototxt-full has no input or no \"probs\" blob.");
  folder.writeList(std::string("folder\0/scan 0.5\n", 17));
  EXPECT_DEATH(detector.load(folder.params()), "Net description .*/folder");
}

// Runs a body with the working directory moved, and moves it back.
template <typename Body>
void InDirectory(const std::string& path, Body body) {
  char previous[PATH_MAX];
  ASSERT_NE(getcwd(previous, sizeof previous), nullptr);
  ASSERT_EQ(chdir(path.c_str()), 0);
  body();
  ASSERT_EQ(chdir(previous), 0);
}

TEST(DetectorLoadingTest, TheBuiltInCascadeFindsItsWeightsRelativeToTheWorkingDirectory) {
  TempDir dir;
  const std::pair<const char*, const char*> nets[] = {
      {"Tavi/public/cascades/x16Net-demo/proto-full", kStage0NetText},
      {"Tavi/public/cascades/x32Net/proto", kStage1NetText},
      {"Tavi/public/cascades/x64Net/proto", kStage2NetText},
      {"Tavi/public/cascades/x32Net-x32-3Scales-200/proto", kCalibrationNetText}};
  for (const auto& net : nets) {
    nn::Net<float> filled(net.second, nn::NetDescription::kText);
    dir.write(net.first, WeightsOf(filled));
  }
  dir.write("run/from/here/.keep", "");

  cv::Mat pixels = ImageWithPatch(200, 150, cv::Rect(50, 50, 40, 40));
  InDirectory(dir.path() + "/run/from/here", [&] {
    Detector detector;
    ASSERT_EQ(detector.load(), STATUS_OK);
    const auto& state = *static_cast<const DetectorState*>(detector.getDetector());
    ASSERT_EQ(state.stages.size(), 3u);
    EXPECT_EQ(state.stages[1].threshold, 0.8f);
    EXPECT_EQ(state.stages[2].threshold, 0.98f);
    EXPECT_EQ(state.stages[2].mean.size(), 6912u);
    EXPECT_EQ(state.calibration.offsetsScales[10].scale, 1.0833333333333333f);
    std::vector<Detection> detections;
    EXPECT_EQ(detect(AsImage(pixels), detector, detections, kParams), STATUS_OK);
  });
}

}  // namespace
}  // namespace tavilib
