#include "detector/pyramid_scan.h"

#include <gtest/gtest.h>

#include <map>

#include "detector/cascade_net_texts.h"
#include "nn/net.h"

namespace tavilib {
namespace {

CascadeStage ScanStage() {
  CascadeStage stage;
  stage.net.reset(new nn::Net<float>(kStage0NetText, nn::NetDescription::kText));
  stage.net->FirstRun();
  return stage;
}

// The last window and the number of windows of each level.
std::map<int32_t, std::pair<Window, int>> Levels(const PyramidScan& scan) {
  std::map<int32_t, std::pair<Window, int>> levels;
  for (const Window& window : scan.windows) {
    auto& level = levels[window.level];
    level.first = window;
    ++level.second;
  }
  return levels;
}

TEST(PyramidScanTest, TheWorkedExampleGivesItsMapsAndLastWindows) {
  CascadeStage stage = ScanStage();
  const cv::Mat image(1200, 1600, CV_8UC3, cv::Scalar(10, 20, 30));
  const CascadeParameter params{1.0f, 320, 0.05f, 3, 1.5f, 12};
  const PyramidScan scan = scanPyramid(image, params, stage);
  EXPECT_EQ(scan.baseScale, 0.15f);
  const auto levels = Levels(scan);
  ASSERT_EQ(levels.size(), 3u);
  EXPECT_EQ(levels.at(0).second, 39 * 29);
  EXPECT_EQ(levels.at(1).second, 25 * 19);
  EXPECT_EQ(levels.at(2).second, 16 * 12);
  const int32_t last[3][3] = {{227, 167, 12}, {220, 160, 18}, {209, 150, 27}};
  for (int32_t level = 0; level < 3; ++level) {
    const Window& window = levels.at(level).first;
    EXPECT_EQ(window.x, last[level][0]) << "level " << level;
    EXPECT_EQ(window.y, last[level][1]) << "level " << level;
    EXPECT_EQ(window.width, last[level][2]);
    EXPECT_EQ(window.height, last[level][2]);
  }
  // Every cell is a window, and its score is a probability.
  for (const Window& window : scan.windows) {
    ASSERT_GE(window.score, 0.0f);
    ASSERT_LE(window.score, 1.0f);
  }
}

TEST(PyramidScanTest, TheScanEndsAtTheFirstLevelThatFailsASizeTest) {
  CascadeStage stage = ScanStage();
  const cv::Mat image(1200, 1600, CV_8UC3, cv::Scalar::all(0));
  // Levels 3 to 5 are 71x53, 47x35 and 31x23; level 6 (21x15) maps to one
  // row of cells and ends the scan.
  CascadeParameter params{1.0f, 320, 0.05f, 10, 1.5f, 12};
  EXPECT_EQ(Levels(scanPyramid(image, params, stage)).size(), 6u);

  // A window of 30 on a base of 120x90: level 3 (35x26) would still map to
  // 5x3 cells, but 26 is not above the window plus one.
  params.windowSize = 30;
  params.minFaceRatio = 0.25f;
  const PyramidScan scan = scanPyramid(image, params, stage);
  EXPECT_EQ(scan.baseScale, 0.075f);
  EXPECT_EQ(Levels(scan).size(), 3u);
  EXPECT_EQ(scan.windows.back().width, static_cast<int32_t>(30 * 2.25f));

  params.numScales = 0;
  EXPECT_TRUE(scanPyramid(image, params, stage).windows.empty());
}

}  // namespace
}  // namespace tavilib
