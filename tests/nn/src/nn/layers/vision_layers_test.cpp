#include "nn/vision_layers.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <numeric>
#include <string>
#include <vector>

#include "gradient_checker.h"

namespace nn {
namespace {

std::string Conv(const std::string& settings) {
  return "type: CONVOLUTION convolution_param { " + settings + " }";
}

TEST(ConvolutionLayerTest, GroupsSeeTheirOwnChannelsThroughPaddingAndStride) {
  // Channel 0 counts 0..8, channel 1 ten times that; output 0 sees channel 0
  // through weights of 1, output 1 channel 1 through weights of 2.
  Blob<float> in(1, 2, 3, 3);
  for (int i = 0; i < 9; ++i) {
    in.mutable_cpu_data()[i] = i;
    in.mutable_cpu_data()[9 + i] = 10 * i;
  }
  OneLayer conv(Conv("num_output: 2 kernel_size: 2 pad: 1 stride: 2 group: 2"), &in);
  SetValues(conv.layer->blobs()[0].get(), {1, 1, 1, 1, 2, 2, 2, 2});
  SetValues(conv.layer->blobs()[1].get(), {0.5f, -1});
  conv.layer->UpdateOffsets();  // group strides come with the weights
  EXPECT_EQ(Shape(conv.out), (std::vector<int>{1, 2, 2, 2}));  // (3 + 2 - 2) / 2 + 1
  // Windows at rows and columns -1 and 1: {0}, {1, 2}, {3, 6}, {4, 5, 7, 8}.
  EXPECT_EQ(conv.Forward(), (std::vector<float>{0.5f, 3.5f, 9.5f, 24.5f, -1, 59, 179, 479}));

  // Padding cells are zeros: a constant image varies at the rim.
  Blob<float> ones(1, 1, 3, 3);
  std::fill(ones.mutable_cpu_data(), ones.mutable_cpu_data() + 9, 1.0f);
  OneLayer padded(Conv("num_output: 1 kernel_size: 3 pad: 1 bias_term: false "
                       "weight_filler { type: 'constant' value: 1 }"),
                  &ones);
  EXPECT_EQ(padded.layer->blobs().size(), 1u) << "no bias blob";
  EXPECT_EQ(padded.Forward(), (std::vector<float>{4, 6, 4, 6, 9, 6, 4, 6, 4}));

  // A bottom smaller than the kernel: (2 - 3) / 2 + 1 truncates to 1.
  Blob<float> small(1, 1, 2, 2);
  EXPECT_EQ(OneLayer(Conv("num_output: 1 kernel_size: 3 stride: 2"), &small).out.height(), 1);
}

// Pools a plane whose values count up from 0, row by row.
std::vector<float> PoolRamp(int height, int width, const std::string& pooling,
                            std::vector<int>* shape = nullptr) {
  Blob<float> in(1, 1, height, width);
  std::iota(in.mutable_cpu_data(), in.mutable_cpu_data() + in.count(), 0.0f);
  OneLayer pool("type: POOLING pooling_param { " + pooling + " }", &in);
  if (shape) {
    *shape = Shape(pool.out);
  }
  return pool.Forward();
}

TEST(PoolingLayerTest, SizesRoundUpAndAveragesCountPadding) {
  // Height 10, kernel 3, stride 2: ceil(7 / 2) + 1 = 5 rows (a convolution
  // gets 4); the last window holds rows 8 and 9 only. Values are 4 row + column.
  std::vector<int> shape;
  EXPECT_EQ(PoolRamp(10, 4, "kernel_size: 3 stride: 2", &shape),
            (std::vector<float>{10, 11, 18, 19, 26, 27, 34, 35, 38, 39}));
  EXPECT_EQ(shape, (std::vector<int>{1, 1, 5, 2}));

  // Padding cells count in the divisor: the corner is (0 + 1 + 3 + 4) / 9.
  const std::vector<float> average = PoolRamp(3, 3, "pool: AVE kernel_size: 3 pad: 1");
  ASSERT_EQ(average.size(), 9u);
  EXPECT_FLOAT_EQ(average[0], 8.0f / 9.0f);
  EXPECT_FLOAT_EQ(average[4], 36.0f / 9.0f);

  // Width 5, kernel 1, stride 3: windows at 0, 3 and 6, the last outside the
  // image, where each method keeps its start value.
  const std::vector<float> max = PoolRamp(1, 5, "kernel_size: 1 stride: 3");
  EXPECT_EQ(max, (std::vector<float>{0, 3, std::numeric_limits<float>::lowest()}));
  const std::vector<float> outside = PoolRamp(1, 5, "pool: AVE kernel_size: 1 stride: 3");
  EXPECT_EQ(outside[2], 0.0f);
  EXPECT_TRUE(std::signbit(outside[2])) << "0 divided by a negative window size";
}

// x (1 + s) ^ -0.75 for the sums of squares s of each cell's window; alpha
// equals the window size in the layers below, so that it cancels.
void ExpectNormalised(const std::vector<float>& out, const std::vector<float>& x,
                      const std::vector<float>& sums) {
  ASSERT_EQ(out.size(), x.size());
  for (size_t i = 0; i < x.size(); ++i) {
    EXPECT_NEAR(out[i], x[i] * std::pow(1.0 + sums[i], -0.75), 1e-6) << "cell " << i;
  }
}

TEST(LRNLayerTest, WindowsAcrossChannelsAfterAShrinkAndWithinAChannel) {
  // Channels 1, 2, 3, 4 at the first position and 4, 3, 2, 1 at the second,
  // set up at a larger size first.
  Blob<float> in(1, 4, 2, 2);
  OneLayer across("type: LRN lrn_param { local_size: 3 alpha: 3 }", &in);
  in.RewriteShape(1, 4, 1, 2);
  const std::vector<float> x = {1, 4, 2, 3, 3, 2, 4, 1};
  SetValues(&in, x);
  across.layer->AlterInputShape(2, 1, across.bottom, &across.top);
  EXPECT_EQ(Shape(across.out), (std::vector<int>{1, 4, 1, 2}));
  // Channels c - 1 to c + 1, none beyond the ends.
  ExpectNormalised(across.Forward(), x, {5, 25, 14, 29, 29, 14, 25, 5});
  // An even size is one short on the leading side: c - 1 to c + 2.
  ExpectNormalised(OneLayer("type: LRN lrn_param { local_size: 4 alpha: 4 }", &in).Forward(), x,
                   {14, 29, 30, 30, 29, 14, 25, 5});

  // Within a channel: a zero-padded 3 x 3 window, divided by its full size.
  Blob<float> row(1, 1, 1, 4);
  SetValues(&row, {1, 2, 3, 4});
  ExpectNormalised(
      OneLayer("type: LRN lrn_param { local_size: 3 alpha: 9 norm_region: WITHIN_CHANNEL }", &row)
          .Forward(),
      {1, 2, 3, 4}, {5, 14, 29, 25});
}

}  // namespace
}  // namespace nn
