#include "detector/cascade_net_texts.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "nn/net.h"

namespace tavilib {
namespace {

using nn::Net;
using nn::NetDescription;

std::vector<int> Shape(const nn::Blob<float>& blob) {
  return {blob.num(), blob.channels(), blob.height(), blob.width()};
}

TEST(CascadeNetTextsTest, EachDescriptionAssemblesIntoItsNet) {
  Net<float> stage0(kStage0NetText, NetDescription::kText);
  EXPECT_EQ(stage0.name(), "900.175");
  EXPECT_EQ(stage0.layers().size(), 7u) << "no split in the scan net";
  EXPECT_EQ(Shape(*stage0.net_input_blobs()[0]), (std::vector<int>{1, 3, 384, 384}));
  EXPECT_EQ(Shape(*stage0.output_blob()), (std::vector<int>{1, 2, 63, 63}));

  Net<float> stage1(kStage1NetText, NetDescription::kText);
  EXPECT_EQ(stage1.name(), "200.654");
  ASSERT_EQ(stage1.layers().size(), 15u);
  EXPECT_EQ(stage1.layer_names()[0], "input_data_0_split") << "data feeds two branches";
  EXPECT_EQ(Shape(*stage1.output_blob()), (std::vector<int>{1, 2, 1, 1}));

  Net<float> stage2(kStage2NetText, NetDescription::kText);
  EXPECT_EQ(stage2.name(), "100.113");
  ASSERT_EQ(stage2.layers().size(), 27u);
  EXPECT_EQ(stage2.layer_names()[0], "input_data_0_split");
  EXPECT_EQ(stage2.layer_names()[1], "x32-data");
  EXPECT_EQ(stage2.layer_names()[2], "x32-data_x32-data_0_split");
  EXPECT_EQ(Shape(*stage2.output_blob()), (std::vector<int>{1, 2, 1, 1}));

  Net<float> calibration(kCalibrationNetText, NetDescription::kText);
  EXPECT_EQ(calibration.name(), "200.79");
  EXPECT_EQ(calibration.layers().size(), 7u);
  EXPECT_EQ(Shape(*calibration.output_blob()), (std::vector<int>{1, 19, 1, 1}));
}

TEST(CascadeNetTextsTest, ScanNetRunsAtSmallerPyramidSizes) {
  Net<float> stage0(kStage0NetText, NetDescription::kText);
  stage0.FirstRun();
  // A 12 x 12 window is one output cell; the stride is 6.
  stage0.AlterInputShape(12, 12);
  EXPECT_EQ(Shape(*stage0.output_blob()), (std::vector<int>{1, 2, 1, 1}));
  stage0.AlterInputShape(240, 180);
  EXPECT_EQ(Shape(*stage0.output_blob()), (std::vector<int>{1, 2, 29, 39}));
  stage0.FF();
  const nn::Blob<float>& probs = *stage0.output_blob();
  for (int i = 0; i < 29 * 39; ++i) {
    ASSERT_NEAR(probs.cpu_data()[i] + probs.cpu_data()[29 * 39 + i], 1.0f, 1e-5);
  }
}

}  // namespace
}  // namespace tavilib
