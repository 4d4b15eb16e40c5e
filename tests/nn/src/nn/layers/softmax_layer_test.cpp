#include <gtest/gtest.h>

#include <cmath>
#include <vector>

#include "gradient_checker.h"
#include "nn/common_layers.h"

namespace nn {
namespace {

TEST(SoftmaxLayerTest, NormalisesAcrossChannelsAtEachPositionOfTheFirstImage) {
  Blob<float> in(2, 3, 2, 2);
  FillUniform(&in, -3, 3);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  SoftmaxLayer<float> layer{LayerParameter()};
  layer.SetUp(bottom, &top);
  layer.Forward(bottom, &top);
  for (int p = 0; p < 4; ++p) {
    float sum = 0;
    double expected_sum = 0;
    for (int c = 0; c < 3; ++c) {
      sum += out.cpu_data()[c * 4 + p];
      expected_sum += std::exp(double(in.cpu_data()[c * 4 + p]));
    }
    EXPECT_NEAR(sum, 1.0f, 1e-6) << "position " << p;
    EXPECT_NEAR(out.cpu_data()[4 + p], std::exp(in.cpu_data()[4 + p]) / expected_sum, 1e-6);
  }

  // The second image keeps exp(x - its maximum): not a distribution.
  float image_max = in.cpu_data()[12];
  for (int j = 12; j < 24; ++j) {
    image_max = std::max(image_max, in.cpu_data()[j]);
  }
  for (int j = 12; j < 24; ++j) {
    EXPECT_FLOAT_EQ(out.cpu_data()[j], std::exp(in.cpu_data()[j] - image_max));
  }
}

TEST(SoftmaxLayerTest, OneMaximumPerImageUnderflowsFarPositions) {
  Blob<float> in(1, 2, 1, 2);
  const float logits[] = {0.0f, -200.0f, 1.0f, -199.0f};  // position 1 is far below position 0
  std::copy(logits, logits + 4, in.mutable_cpu_data());
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  SoftmaxLayer<float> layer{LayerParameter()};
  layer.SetUp(bottom, &top);
  layer.Forward(bottom, &top);
  EXPECT_NEAR(out.cpu_data()[2], 1.0f / (1.0f + std::exp(-1.0f)), 1e-6);
  EXPECT_TRUE(std::isnan(out.cpu_data()[1])) << "0 / 0 where every exponential underflowed";
}

TEST(SoftmaxLayerTest, AlterInputShapeAndGradients) {
  Blob<float> in(1, 2, 3, 4);
  FillUniform(&in, -1, 1);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  SoftmaxLayer<float> layer{LayerParameter()};
  layer.SetUp(bottom, &top);
  in.RewriteShape(1, 2, 2, 3);
  layer.AlterInputShape(3, 2, bottom, &top);
  EXPECT_EQ(out.count(), 12);
  layer.Forward(bottom, &top);
  EXPECT_NEAR(out.cpu_data()[5] + out.cpu_data()[11], 1.0f, 1e-6) << "non-square map";

  for (int num : {1, 2}) {
    Blob<float> batch(num, 3, 2, 3);
    FillUniform(&batch, -2, 2);
    Blob<float> result;
    std::vector<Blob<float>*> batch_bottom = {&batch};
    std::vector<Blob<float>*> batch_top = {&result};
    SoftmaxLayer<float> softmax{LayerParameter()};
    softmax.SetUp(batch_bottom, &batch_top);
    GradientChecker(1e-3f, 1e-2f).Check(&softmax, batch_bottom, &batch_top);
  }
}

TEST(SoftmaxLayerDeathTest, OneChannelIsRefused) {
  Blob<float> in(1, 1, 2, 2);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  EXPECT_DEATH(SoftmaxLayer<float>(LayerParameter()).SetUp(bottom, &top),
               "Check failed: \\(\\*top\\)\\[0\\]->channels\\(\\) >= 2 .*Softmax Layer takes more "
               "than two-channels output.");
}

}  // namespace
}  // namespace nn
