#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>

#include <vector>

#include "gradient_checker.h"
#include "nn/vision_layers.h"

namespace nn {
namespace {

LayerParameter ConvParam(const std::string& convolution) {
  LayerParameter param;
  EXPECT_TRUE(google::protobuf::TextFormat::ParseFromString(
      "convolution_param { " + convolution + " }", &param));
  return param;
}

// The convolution by its definition, as a reference.
float DirectConv(const Blob<float>& in, const Blob<float>& weights, float bias, int n, int o, int y,
                 int x, int pad, int stride, int group) {
  const int k = weights.height();
  const int in_per_group = in.channels() / group;
  const int out_per_group = weights.num() / group;
  const int g = o / out_per_group;
  float sum = bias;
  for (int c = 0; c < in_per_group; ++c) {
    for (int i = 0; i < k; ++i) {
      for (int j = 0; j < k; ++j) {
        const int h = y * stride - pad + i;
        const int w = x * stride - pad + j;
        if (h >= 0 && h < in.height() && w >= 0 && w < in.width()) {
          sum += in.cpu_data()[in.offset(n, g * in_per_group + c, h, w)] *
                 weights.cpu_data()[weights.offset(o, c, i, j)];
        }
      }
    }
  }
  return sum;
}

TEST(ConvolutionLayerTest, MatchesTheDirectConvolutionWithPaddingStrideAndGroups) {
  Blob<float> in(2, 4, 7, 6);
  FillUniform(&in, -1, 1);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  ConvolutionLayer<float> layer(ConvParam(
      "num_output: 6 kernel_size: 3 pad: 1 stride: 2 group: 2 "
      "weight_filler { type: 'uniform' min: -1 max: 1 } bias_filler { type: 'uniform' }"));
  layer.SetUp(bottom, &top);
  layer.UpdateOffsets();  // group strides come with the weights
  ASSERT_EQ(out.num(), 2);
  ASSERT_EQ(out.channels(), 6);
  ASSERT_EQ(out.height(), 4);  // (7 + 2 - 3) / 2 + 1
  ASSERT_EQ(out.width(), 3);
  layer.Forward(bottom, &top);
  for (int n = 0; n < 2; ++n) {
    for (int o = 0; o < 6; ++o) {
      for (int y = 0; y < 4; ++y) {
        for (int x = 0; x < 3; ++x) {
          EXPECT_NEAR(out.cpu_data()[out.offset(n, o, y, x)],
                      DirectConv(in, *layer.blobs()[0], layer.blobs()[1]->cpu_data()[o], n, o, y,
                                 x, 1, 2, 2),
                      1e-5);
        }
      }
    }
  }
}

TEST(ConvolutionLayerTest, PaddingMakesAConstantImageVaryAtTheRim) {
  Blob<float> in(1, 1, 3, 3);
  std::fill(in.mutable_cpu_data(), in.mutable_cpu_data() + 9, 1.0f);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  ConvolutionLayer<float> layer(ConvParam(
      "num_output: 1 kernel_size: 3 pad: 1 bias_term: false "
      "weight_filler { type: 'constant' value: 1 }"));
  layer.SetUp(bottom, &top);
  EXPECT_EQ(layer.blobs().size(), 1u) << "no bias blob";
  layer.Forward(bottom, &top);
  EXPECT_EQ(std::vector<float>(out.cpu_data(), out.cpu_data() + 9),
            (std::vector<float>{4, 6, 4, 6, 9, 6, 4, 6, 4}));
}

TEST(ConvolutionLayerTest, AlterInputShapeRewritesTheTopWithoutMemory) {
  Blob<float> in(1, 2, 10, 10);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  ConvolutionLayer<float> layer(ConvParam("num_output: 3 kernel_size: 3"));
  layer.SetUp(bottom, &top);
  const size_t bytes = out.data()->size();
  in.RewriteShape(1, 2, 5, 4);
  layer.AlterInputShape(4, 5, bottom, &top);
  EXPECT_EQ(out.height(), 3);
  EXPECT_EQ(out.width(), 2);
  EXPECT_EQ(out.count(), 18);
  EXPECT_EQ(out.data()->size(), bytes);

  // A bottom smaller than the kernel still gives one cell when stride allows.
  Blob<float> small(1, 1, 2, 2);
  Blob<float> small_out;
  std::vector<Blob<float>*> small_bottom = {&small};
  std::vector<Blob<float>*> small_top = {&small_out};
  ConvolutionLayer<float> wide(ConvParam("num_output: 1 kernel_size: 3 stride: 2"));
  wide.SetUp(small_bottom, &small_top);
  EXPECT_EQ(small_out.height(), 1);  // (2 - 3) / 2 + 1 truncates to 1
}

TEST(ConvolutionLayerTest, GradientsMatchFiniteDifferences) {
  Blob<float> in(2, 4, 5, 6);
  FillUniform(&in, -1, 1);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  ConvolutionLayer<float> layer(ConvParam(
      "num_output: 4 kernel_size: 3 pad: 1 stride: 2 group: 2 "
      "weight_filler { type: 'uniform' min: -1 max: 1 } bias_filler { type: 'uniform' }"));
  layer.SetUp(bottom, &top);
  layer.UpdateOffsets();
  GradientChecker(1e-2f, 1e-2f).Check(&layer, bottom, &top);
}

TEST(ConvolutionLayerDeathTest, SetUpChecksItsParameters) {
  Blob<float> in(1, 3, 5, 5);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  std::vector<Blob<float>*> two = {&in, &in};
  EXPECT_DEATH(ConvolutionLayer<float>(ConvParam("num_output: 1 kernel_size: 3")).SetUp(two, &top),
               "Check failed: bottom.size\\(\\) == 1 .*Conv Layer takes a single blob as input.");
  EXPECT_DEATH(ConvolutionLayer<float>(ConvParam("kernel_size: 3")).SetUp(bottom, &top),
               "Check failed: num_output_ > 0 ");
  EXPECT_DEATH(
      ConvolutionLayer<float>(ConvParam("num_output: 2 kernel_size: 3 group: 2")).SetUp(bottom, &top),
      "Check failed: channels_ % group_ == 0 ");
  Blob<float> four(1, 4, 5, 5);
  std::vector<Blob<float>*> four_bottom = {&four};
  EXPECT_DEATH(ConvolutionLayer<float>(ConvParam("num_output: 3 kernel_size: 3 group: 2"))
                   .SetUp(four_bottom, &top),
               "Number of output should be multiples of group.");
  EXPECT_DEATH(
      {
        ConvolutionLayer<float> grouped(ConvParam("num_output: 2 kernel_size: 3 group: 2"));
        grouped.SetUp(four_bottom, &top);
        grouped.CheckBinarization();
      },
      "Check failed: group_ == 1 .*binarization supports only single group.");
}

}  // namespace
}  // namespace nn
