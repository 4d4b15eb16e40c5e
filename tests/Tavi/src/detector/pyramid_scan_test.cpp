#include "detector/pyramid_scan.h"

#include <gtest/gtest.h>

#include <map>
#include <random>

#include "detector/cascade_loader.h"
#include "detector/cascade_net_texts.h"
#include "detector/image_planes.h"
#include "detector/pyramid_geometry.h"
#include "detector/scan_settings.h"
#include "nn/net.h"
#include "nn/util/io.h"

namespace tavilib {
namespace {

CascadeParameter Params(int32_t normalizedSize, float maxUpscale, float minFaceRatio) {
  return CascadeParameter{maxUpscale, normalizedSize, minFaceRatio, 3, 1.5f, 12};
}

TEST(PyramidGeometryTest, LargeImagesShrinkFullySmallOnesGrowAtMostByMaxUpscale) {
  // A long edge of exactly normalizedSize: ratio 1 or maxUpscale, the smaller;
  // one pixel more: the full ratio, whatever maxUpscale says. A small image is
  // enlarged by the ratio, capped by maxUpscale.
  const struct { int columns, rows; float maxUpscale, ratio; } cases[] = {
      {320, 200, 2.0f, 1.0f}, {200, 320, 0.5f, 0.5f}, {321, 200, 0.5f, 320.0f / 321.0f},
      {100, 80, 1.0f, 1.0f},  {100, 80, 2.0f, 2.0f},  {100, 80, 8.0f, 3.2f}};
  for (const auto& c : cases) {
    EXPECT_EQ(computePyramidGeometry(c.columns, c.rows, Params(320, c.maxUpscale, 0.1f)).ratio, c.ratio)
        << c.columns << "x" << c.rows << " " << c.maxUpscale;
  }
  // minimum face 32, so the base scale is 12 / 32 * 2 and the base 75 x 60.
  const PyramidGeometry g = computePyramidGeometry(100, 80, Params(320, 2.0f, 0.1f));
  EXPECT_EQ(g.minimumFace, 32);
  EXPECT_EQ(g.baseScale, 0.75f);
  EXPECT_EQ(g.baseWidth, 75);
  EXPECT_EQ(g.baseHeight, 60);
}

TEST(ScanSettingsTest, GiveExactlyTheMinimumFaceAndABaseInsideTheScanInput) {
  std::mt19937 random(3);
  for (int trial = 0; trial < 3000; ++trial) {
    const int columns = 20 + static_cast<int>(random() % 3000);
    const int rows = 20 + static_cast<int>(random() % 3000);
    const int minFace = 1 + static_cast<int>(random() % 150);
    const CascadeParameter settings = fittingScanSettings(columns, rows, minFace, 640, 480);
    const PyramidGeometry geometry = computePyramidGeometry(columns, rows, settings);
    ASSERT_TRUE(geometry.baseWidth <= 640 && geometry.baseHeight <= 480) << columns << "x" << rows;
    const int honoured = minimumFaceOf(settings, columns, rows);
    ASSERT_GE(honoured, minFace);
    if (honoured > minFace) {
      // Only as much larger as the scan input demands.
      const PyramidGeometry smaller = computePyramidGeometry(
          columns, rows, fittingScanSettings(columns, rows, honoured - 1, 100000, 100000));
      ASSERT_TRUE(smaller.baseWidth > 640 || smaller.baseHeight > 480);
    }
  }
}

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
    levels[window.level].first = window;
    ++levels[window.level].second;
  }
  return levels;
}

TEST(PyramidScanTest, TheWorkedExampleGivesItsGeometryMapsAndLastWindowsAndEndsOnSize) {
  const PyramidGeometry g = computePyramidGeometry(1600, 1200, Params(320, 1.0f, 0.05f));
  EXPECT_EQ(g.ratio, 0.2f);
  EXPECT_EQ(g.minimumFace, 16);
  EXPECT_EQ(g.baseScale, 0.15f);
  EXPECT_EQ(g.baseWidth, 240);
  EXPECT_EQ(g.baseHeight, 180);
  EXPECT_EQ(levelFactor(1.5f, 0), 1.0f);
  EXPECT_EQ(levelFactor(1.5f, 2), 2.25f);
  EXPECT_EQ(levelLength(240, levelFactor(1.5f, 1)), 160);
  EXPECT_EQ(levelLength(180, levelFactor(1.5f, 2)), 80);
  // From the base, not from the level before: 106 / 2.25 is 47, while
  // 106 / 1.5 / 1.5 would give 46.
  EXPECT_EQ(levelLength(106, levelFactor(1.5f, 2)), 47);
  CascadeStage stage = ScanStage();
  const cv::Mat image(1200, 1600, CV_8UC3, cv::Scalar(10, 20, 30));
  const PyramidScan scan = scanPyramid(image, Params(320, 1.0f, 0.05f), stage);
  const auto levels = Levels(scan);
  ASSERT_EQ(levels.size(), 3u);
  // Cells of each level, and the last window's corner and side.
  const int32_t expected[3][4] = {{39 * 29, 227, 167, 12}, {25 * 19, 220, 160, 18}, {16 * 12, 209, 150, 27}};
  for (int32_t level = 0; level < 3; ++level) {
    const Window& w = levels.at(level).first;
    EXPECT_EQ((std::vector<int32_t>{levels.at(level).second, w.x, w.y, w.width, w.height}),
              (std::vector<int32_t>{expected[level][0], expected[level][1], expected[level][2],
                                    expected[level][3], expected[level][3]})) << level;
  }
  for (const Window& window : scan.windows) {
    ASSERT_TRUE(window.score >= 0.0f && window.score <= 1.0f);
  }

  // The scan ends at the first level that fails a size test. Levels 3 to 5
  // are 71x53, 47x35 and 31x23; level 6 (21x15) maps to one row of cells.
  CascadeParameter params = Params(320, 1.0f, 0.05f);
  params.numScales = 10;
  EXPECT_EQ(Levels(scanPyramid(image, params, stage)).size(), 6u);

  // A window of 30 on a base of 120x90: level 3 (35x26) would still map to
  // 5x3 cells, but 26 is not above the window plus one.
  params.windowSize = 30;
  params.minFaceRatio = 0.25f;
  const PyramidScan larger = scanPyramid(image, params, stage);
  EXPECT_EQ(larger.baseScale, 0.075f);
  EXPECT_EQ(Levels(larger).size(), 3u);
  EXPECT_EQ(larger.windows.back().width, static_cast<int32_t>(30 * 2.25f));

  params.numScales = 0;
  EXPECT_TRUE(scanPyramid(image, params, stage).windows.empty());
}

TEST(PyramidScanTest, ShippedScanNetStoresAZeroResponseAndScansSmallLevelsLikeANetOfTheirSize) {
  const std::string folder = TAVI_SOURCE_DIR "/Tavi/public/cascades/x16Net-demo";
  CascadeStage primed = loadFullStage(folder);
  nn::Net<float>& net = *primed.net;
  // A constant image of 100 gives the first convolution r + r: the stored
  // response r, added once more by the primed pass.
  net.AlterInputShape(40, 30);
  nn::Blob<float>& input = *net.net_input_blobs()[0];
  std::fill_n(input.mutable_cpu_data(), input.count(), 100.0f);
  net.FF();
  const nn::Blob<float>& firstConvolution = *net.top_vecs()[0][0];
  for (int i = 0; i < firstConvolution.count(); ++i) {
    ASSERT_NEAR(firstConvolution.cpu_data()[i], 0.0f, 1e-4f) << i;
  }

  // A level smaller than the declared input, through the primed net, against
  // a plain pass of the net declared at the level's size.
  nn::NetParameter description;
  nn::ReadNetParamsFromTextFile(folder + "/prototxt-full", &description);
  description.set_input_dim(2, 71);
  description.set_input_dim(3, 97);
  nn::Net<float> plain(description);
  plain.CopyTrainedLayersFrom(folder + "/proto-full");
  cv::Mat level(71, 97, CV_8UC3);
  cv::randu(level, cv::Scalar::all(0), cv::Scalar::all(256));
  net.AlterInputShape(97, 71);
  writeImagePlanes(level, &input);
  writeImagePlanes(level, plain.net_input_blobs()[0]);
  const nn::Blob<float>& scanned = *net.FF()[0];
  const nn::Blob<float>& expected = *plain.Forward()[0];
  ASSERT_EQ(scanned.count(), expected.count());
  for (int i = 0; i < expected.count(); ++i) {
    ASSERT_NEAR(scanned.cpu_data()[i], expected.cpu_data()[i], 1e-5f) << i;
  }
}

}  // namespace
}  // namespace tavilib
