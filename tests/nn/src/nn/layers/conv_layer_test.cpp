#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "gradient_checker.h"
#include "nn/vision_layers.h"

namespace nn {
namespace {

std::string Conv(const std::string& settings) {
  return "type: CONVOLUTION convolution_param { " + settings + " }";
}

TEST(ConvolutionLayerTest, MatchesTheDefinitionWithPaddingStrideAndGroups) {
  Blob<float> in(2, 4, 7, 6);
  FillUniform(&in, -1, 1);
  OneLayer conv(Conv("num_output: 6 kernel_size: 3 pad: 1 stride: 2 group: 2 weight_filler { "
                     "type: 'uniform' min: -1 max: 1 } bias_filler { type: 'uniform' }"),
                &in);
  conv.layer->UpdateOffsets();  // group strides come with the weights
  ASSERT_EQ(Shape(conv.out), (std::vector<int>{2, 6, 4, 3}));  // (7 + 2 - 3) / 2 + 1 rows
  conv.Forward();
  const Blob<float>& w = *conv.layer->blobs()[0];
  for (int n = 0; n < 2; ++n) {
    for (int o = 0; o < 6; ++o) {
      for (int y = 0; y < 4; ++y) {
        for (int x = 0; x < 3; ++x) {
          // Outputs 0 to 2 see input channels 0 and 1, outputs 3 to 5 the others.
          double sum = conv.layer->blobs()[1]->cpu_data()[o];
          for (int c = 0; c < 2; ++c) {
            for (int i = 0; i < 9; ++i) {
              const int h = 2 * y - 1 + i / 3;
              const int v = 2 * x - 1 + i % 3;
              if (h >= 0 && h < 7 && v >= 0 && v < 6) {
                sum += in.cpu_data()[in.offset(n, 2 * (o / 3) + c, h, v)] *
                       w.cpu_data()[w.offset(o, c, i / 3, i % 3)];
              }
            }
          }
          EXPECT_NEAR(conv.out.cpu_data()[conv.out.offset(n, o, y, x)], sum, 1e-5);
        }
      }
    }
  }

  // Padding cells are zeros: a constant image varies at the rim.
  Blob<float> ones(1, 1, 3, 3);
  std::fill(ones.mutable_cpu_data(), ones.mutable_cpu_data() + 9, 1.0f);
  OneLayer padded(Conv("num_output: 1 kernel_size: 3 pad: 1 bias_term: false "
                       "weight_filler { type: 'constant' value: 1 }"),
                  &ones);
  EXPECT_EQ(padded.layer->blobs().size(), 1u) << "no bias blob";
  EXPECT_EQ(padded.Forward(), (std::vector<float>{4, 6, 4, 6, 9, 6, 4, 6, 4}));
}

TEST(ConvolutionLayerTest, AlterInputShapeRewritesTheTopWithoutMemory) {
  Blob<float> in(1, 2, 10, 10);
  OneLayer conv(Conv("num_output: 3 kernel_size: 3"), &in);
  const size_t bytes = conv.out.data()->size();
  in.RewriteShape(1, 2, 5, 4);
  conv.layer->AlterInputShape(4, 5, conv.bottom, &conv.top);
  EXPECT_EQ(Shape(conv.out), (std::vector<int>{1, 3, 3, 2}));
  EXPECT_EQ(conv.out.data()->size(), bytes);

  // A bottom smaller than the kernel: (2 - 3) / 2 + 1 truncates to 1.
  Blob<float> small(1, 1, 2, 2);
  EXPECT_EQ(OneLayer(Conv("num_output: 1 kernel_size: 3 stride: 2"), &small).out.height(), 1);
}

TEST(ConvolutionLayerDeathTest, SetUpChecksItsParameters) {
  Blob<float> in(1, 3, 5, 5);
  Blob<float> four(1, 4, 5, 5);
  Blob<float> out;
  Blobs two = {&in, &in};
  Blobs top = {&out};
  EXPECT_DEATH(ConvolutionLayer<float>(Parse<LayerParameter>(Conv("num_output: 1 kernel_size: 3")))
                   .SetUp(two, &top),
               "bottom.size\\(\\) == 1 .*Conv Layer takes a single blob as input.");
  EXPECT_DEATH(OneLayer(Conv("kernel_size: 3"), &in), "Check failed: num_output_ > 0 ");
  EXPECT_DEATH(OneLayer(Conv("num_output: 2 kernel_size: 3 group: 2"), &in),
               "Check failed: channels_ % group_ == 0 ");
  EXPECT_DEATH(OneLayer(Conv("num_output: 3 kernel_size: 3 group: 2"), &four),
               "Number of output should be multiples of group.");
  EXPECT_DEATH(static_cast<ConvolutionLayer<float>*>(
                   OneLayer(Conv("num_output: 2 kernel_size: 3 group: 2"), &four).layer.get())
                   ->CheckBinarization(),
               "binarization supports only single group.");
}

}  // namespace
}  // namespace nn
