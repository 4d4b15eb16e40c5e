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
  // Split layers are inserted where the data feeds two branches.
  const struct { const char* text; const char* name; size_t layers; std::vector<int> input, output; } nets[] = {
      {kStage0NetText, "900.175", 7, {1, 3, 384, 384}, {1, 2, 63, 63}},
      {kStage1NetText, "200.654", 15, {1, 3, 24, 24}, {1, 2, 1, 1}},
      {kStage2NetText, "100.113", 27, {1, 3, 48, 48}, {1, 2, 1, 1}},
      {kCalibrationNetText, "200.79", 7, {1, 3, 24, 24}, {1, 19, 1, 1}}};
  for (const auto& expected : nets) {
    Net<float> net(expected.text, NetDescription::kText);
    EXPECT_EQ(net.name(), expected.name);
    EXPECT_EQ(net.layers().size(), expected.layers) << expected.name;
    EXPECT_EQ(Shape(*net.net_input_blobs()[0]), expected.input) << expected.name;
    EXPECT_EQ(Shape(*net.output_blob()), expected.output) << expected.name;
  }
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
