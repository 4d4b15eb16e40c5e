#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <numeric>
#include <string>
#include <vector>

#include "gradient_checker.h"
#include "nn/common_layers.h"
#include "nn/engine.h"
#include "nn/neuron_layers.h"

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

void Ramp(Blob<float>* blob, float start) {
  std::iota(blob->mutable_cpu_data(), blob->mutable_cpu_data() + blob->count(), start);
}

TEST(InnerProductLayerTest, ImagesAreFlatRowsTimesTheWeightsPlusTheBias) {
  Blob<float> in(2, 1, 2, 2);
  Ramp(&in, 0);
  OneLayer ip("type: INNER_PRODUCT inner_product_param { num_output: 2 }", &in);
  ASSERT_EQ(Shape(*ip.layer->blobs()[0]), (std::vector<int>{1, 1, 2, 4}));
  SetValues(ip.layer->blobs()[0].get(), {1, 0, 0, 0, 0, 1, 1, 1});
  SetValues(ip.layer->blobs()[1].get(), {0, 10});
  EXPECT_EQ(ip.Forward(), (std::vector<float>{0, 16, 4, 28}));
}

TEST(PlumbingLayersTest, ConcatJoinsSplitAndFlattenShareEltwiseMultiplies) {
  Blob<float> a(1, 2, 1, 2);
  Blob<float> b(1, 1, 1, 2);
  Blob<float> c(2, 2, 1, 2);
  Ramp(&a, 0);
  Ramp(&b, 10);
  Ramp(&c, 20);
  Blob<float> out;
  Blobs top = {&out};
  Blobs by_channels = {&a, &b};
  ConcatLayer<float> channels{LayerParameter()};
  channels.SetUp(by_channels, &top);
  channels.Forward(by_channels, &top);
  EXPECT_EQ(Shape(out), (std::vector<int>{1, 3, 1, 2}));
  EXPECT_EQ(Values(out), (std::vector<float>{0, 1, 2, 3, 10, 11}));
  Blobs by_num = {&a, &c};
  ConcatLayer<float> nums(Parse<LayerParameter>("concat_param { concat_dim: 0 }"));
  nums.SetUp(by_num, &top);
  nums.Forward(by_num, &top);
  EXPECT_EQ(Values(out), (std::vector<float>{0, 1, 2, 3, 20, 21, 22, 23, 24, 25, 26, 27}));

  Blob<float> second;
  Blobs bottom = {&c};
  Blobs tops = {&out, &second};
  SplitLayer<float> split{LayerParameter()};
  split.SetUp(bottom, &tops);
  split.Forward(bottom, &tops);
  EXPECT_EQ(second.cpu_data(), c.cpu_data()) << "no data moves";
  OneLayer flatten("type: FLATTEN", &c);
  flatten.Forward();
  EXPECT_EQ(Shape(flatten.out), (std::vector<int>{2, 4, 1, 1}));
  EXPECT_EQ(flatten.out.cpu_data(), c.cpu_data());

  Blobs factors = {&c, &c, &c};
  EltwiseProductLayer<float> multiply{LayerParameter()};
  multiply.SetUp(factors, &top);
  multiply.Forward(factors, &top);
  EXPECT_EQ(out.cpu_data()[7], 27.0f * 27 * 27);

  Blob<float> image(2, 2, 4, 5);
  EXPECT_EQ(Shape(OneLayer("type: IM2COL convolution_param { kernel_size: 3 pad: 1 stride: 2 }",
                           &image).out),
            (std::vector<int>{2, 18, 2, 3}));
}

TEST(SoftmaxLayerTest, NormalisesEachPositionOfTheFirstImageOnly) {
  // Logits are logarithms of these, channel by channel: the first image has
  // 1, 2, 5 at its first position and 3, 3, 2 at its second, each summing to 8;
  // the second image's maximum is 8 too, but its positions sum to 7 and 11.
  const std::vector<float> e = {1, 3, 2, 3, 5, 2, 1, 8, 4, 2, 2, 1};
  Blob<float> in(2, 3, 1, 2);
  for (int i = 0; i < 12; ++i) {
    in.mutable_cpu_data()[i] = std::log(e[i]);
  }
  const std::vector<float> out = OneLayer("type: SOFTMAX", &in).Forward();
  for (int i = 0; i < 12; ++i) {
    EXPECT_NEAR(out[i], e[i] / 8, 1e-6) << i;
  }

  // One maximum for the whole image: the second position lies 200 below it,
  // so its exponentials underflow and give 0 / 0.
  Blob<float> far(1, 2, 1, 2);
  SetValues(&far, {0, -200, 1, -199});
  const std::vector<float> probs = OneLayer("type: SOFTMAX", &far).Forward();
  EXPECT_NEAR(probs[2], 1 / (1 + std::exp(-1.0)), 1e-6);
  EXPECT_TRUE(std::isnan(probs[1]));
}

TEST(NeuronLayersTest, ForwardFormulasAndTheirOverflows) {
  Blob<float> x(1, 1, 1, 4);
  SetValues(&x, {-2.0f, 0.5f, 60.0f, std::numeric_limits<float>::quiet_NaN()});
  const std::vector<float> relu = OneLayer("type: RELU", &x).Forward();
  EXPECT_EQ(relu[0], 0.0f);
  EXPECT_EQ(relu[2], 60.0f);
  EXPECT_TRUE(std::isnan(relu[3])) << "a NaN stays NaN";
  EXPECT_FLOAT_EQ(OneLayer("type: SIGMOID", &x).Forward()[1], 1.0f / (1.0f + std::exp(-0.5f)));
  const std::vector<float> tanh = OneLayer("type: TANH", &x).Forward();
  EXPECT_FLOAT_EQ(tanh[0], std::tanh(-2.0f));
  EXPECT_TRUE(std::isnan(tanh[2])) << "exp(120) overflows: inf / inf";
  const std::vector<float> softplus = OneLayer("type: BNLL", &x).Forward();
  EXPECT_FLOAT_EQ(softplus[0], std::log1p(std::exp(-2.0f)));
  EXPECT_FLOAT_EQ(softplus[2], 60.0f);

  // Power: (shift + scale x) ^ power, with 1 for power 0 whatever the shift.
  SetValues(&x, {1, 2, 4, 0});
  const struct {
    const char* param;
    std::vector<float> expected;
  } powers[] = {{"power: 0 scale: 0 shift: 3", {1, 1, 1, 1}},
                {"power: 2 scale: 0 shift: 3", {9, 9, 9, 9}},
                {"power: 0.5 scale: 2 shift: 1", {std::sqrt(3.0f), std::sqrt(5.0f), 3, 1}},
                {"", {1, 2, 4, 0}}};
  for (const auto& p : powers) {
    EXPECT_EQ(OneLayer(std::string("type: POWER power_param { ") + p.param + " }", &x).Forward(),
              p.expected)
        << p.param;
  }

  // In place, ReLU overwrites its bottom.
  Blobs same = {&x};
  SetValues(&x, {-1, 2, -3, 4});
  ReLULayer<float> relu_in_place{LayerParameter()};
  relu_in_place.SetUp(same, &same);
  relu_in_place.Forward(same, &same);
  EXPECT_EQ(Values(x), (std::vector<float>{0, 2, 0, 4}));
}

TEST(NeuronLayersTest, DropoutScalesSurvivorsInTrainingAndCopiesInTesting) {
  Blob<float> x(1, 1, 20, 20);
  std::fill(x.mutable_cpu_data(), x.mutable_cpu_data() + 400, 1.0f);
  Engine::set_phase(Engine::TEST);
  OneLayer dropout("type: DROPOUT dropout_param { dropout_ratio: 0.75 }", &x);
  EXPECT_EQ(dropout.Forward(), std::vector<float>(400, 1.0f));

  Engine::set_phase(Engine::TRAIN);
  const std::vector<float> kept = dropout.Forward();
  int survivors = 0;
  for (float v : kept) {
    ASSERT_TRUE(v == 0.0f || v == 4.0f) << v;
    survivors += v != 0.0f;
  }
  EXPECT_GT(survivors, 50);
  EXPECT_LT(survivors, 150);
  std::fill(dropout.out.mutable_cpu_diff(), dropout.out.mutable_cpu_diff() + 400, 0.5f);
  dropout.layer->Backward(dropout.top, true, &dropout.bottom);
  for (int i = 0; i < 400; ++i) {
    ASSERT_EQ(x.cpu_diff()[i], kept[i] * 0.5f) << "the same mask on the way back";
  }
  Engine::set_phase(Engine::TEST);
  EXPECT_DEATH(dropout.layer->Backward(dropout.top, true, &dropout.bottom),
               "Check failed: Engine::phase\\(\\) == Engine::TRAIN ");
}

}  // namespace
}  // namespace nn
