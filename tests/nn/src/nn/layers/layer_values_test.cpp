#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include "gradient_checker.h"
#include "nn/common_layers.h"
#include "nn/engine.h"
#include "nn/neuron_layers.h"
#include "nn/util/math_functions.h"

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
  EXPECT_EQ(ForwardOn(Conv("num_output: 1 kernel_size: 3 pad: 1 bias_term: false "
                           "weight_filler { type: 'constant' value: 1 }"),
                      {1, 1, 3, 3}, std::vector<float>(9, 1)),
            (std::vector<float>{4, 6, 4, 6, 9, 6, 4, 6, 4}));
  // A 1x1 kernel multiplies the image where it lies: each group its own
  // channels, or, while the offsets are still 0, every group the first
  // group's slices of the image and of the output.
  Blob<float> four(1, 4, 1, 2);
  SetValues(&four, {1, 2, 10, 20, 100, 200, 1000, 2000});
  OneLayer pointwise(Conv("num_output: 2 kernel_size: 1 group: 2 bias_term: false "
                          "weight_filler { type: 'constant' value: 3 }"),
                     &four);
  EXPECT_EQ(pointwise.Forward(), (std::vector<float>{33, 66, 0, 0}));
  pointwise.layer->UpdateOffsets();
  EXPECT_EQ(pointwise.Forward(), (std::vector<float>{33, 66, 3300, 6600}));
  // A bottom smaller than the kernel: (2 - 3) / 2 + 1 truncates to 1.
  std::vector<int> shape;
  ForwardOn(Conv("num_output: 1 kernel_size: 3 stride: 2"), {1, 1, 2, 2}, Ramp(4), &shape);
  EXPECT_EQ(shape, (std::vector<int>{1, 1, 1, 1}));

  // A map large enough to be unfolded in several bands of rows (16 channels,
  // kernel 5: 400 column rows of 2,700 outputs), two images, padding: every
  // output is the sum over its own window.
  Blob<float> wide(2, 16, 135, 180);
  FillUniform(&wide, -1, 1);
  OneLayer big(Conv("num_output: 3 kernel_size: 5 stride: 3 pad: 1 "
                    "weight_filler { type: 'gaussian' std: 0.1 } bias_filler { type: 'gaussian' }"),
               &wide);
  ASSERT_EQ(Shape(big.out), (std::vector<int>{2, 3, 45, 60}));
  const std::vector<float> out = big.Forward();
  const float* w = big.layer->blobs()[0]->cpu_data();
  for (int n = 0; n < 2; ++n) {
    for (int o = 0; o < 3; ++o) {
      for (int cell = 0; cell < 2700; ++cell) {
        double sum = big.layer->blobs()[1]->cpu_data()[o];
        for (int c = 0; c < 16; ++c) {
          for (int i = 0; i < 25; ++i) {
            const int y = cell / 60 * 3 - 1 + i / 5;
            const int x = cell % 60 * 3 - 1 + i % 5;
            if (y >= 0 && y < 135 && x >= 0 && x < 180) {
              sum += w[(o * 16 + c) * 25 + i] * wide.cpu_data()[((n * 16 + c) * 135 + y) * 180 + x];
            }
          }
        }
        ASSERT_NEAR(out[(n * 3 + o) * 2700 + cell], sum, 1e-4) << n << " " << o << " " << cell;
      }
    }
  }
}

TEST(MathFunctionsTest, Im2colUnfoldsWithZeroPaddingAndCol2imAddsBack) {
  // The 2x2 image 1, 2, 3, 4 under 2x2 windows, padding 1, stride 2: each
  // window sees one pixel, in the opposite corner.
  const std::vector<float> image = {1, 2, 3, 4};
  std::vector<float> col(16, 99.0f);
  im2col(image.data(), 1, 2, 2, 2, 1, 2, col.data());
  EXPECT_EQ(col, (std::vector<float>{0, 0, 0, 4, 0, 0, 3, 0, 0, 2, 0, 0, 1, 0, 0, 0}));
  std::vector<float> back(4, 42.0f);
  col2im(col.data(), 1, 2, 2, 2, 1, 2, back.data());
  EXPECT_EQ(back, image) << "the image is cleared first and padding cells skipped";

  // Every cell against its definition, for the strides, kernels, paddings and
  // odd widths whose rows are copied, gathered or taken from a neighbour row.
  for (int stride = 1; stride <= 3; ++stride) {
    for (int ksize = 1; ksize <= 5; ++ksize) {
      for (int pad = 0; pad <= 2; ++pad) {
        const int height = 9;
        const int width = 7 + 4 * stride;
        const std::vector<float> ramp = Ramp(2 * height * width);
        const int height_col = (height + 2 * pad - ksize) / stride + 1;
        const int width_col = (width + 2 * pad - ksize) / stride + 1;
        std::vector<float> cols(2 * ksize * ksize * height_col * width_col, -7.0f);
        im2col(ramp.data(), 2, height, width, ksize, pad, stride, cols.data());
        for (size_t i = 0; i < cols.size(); ++i) {
          const int w = i % width_col;
          const int h = i / width_col % height_col;
          const int c = i / width_col / height_col;
          const int y = h * stride - pad + c / ksize % ksize;
          const int x = w * stride - pad + c % ksize;
          const bool inside = y >= 0 && y < height && x >= 0 && x < width;
          ASSERT_EQ(cols[i], inside ? ramp[(c / ksize / ksize * height + y) * width + x] : 0.0f)
              << stride << " " << ksize << " " << pad << " " << i;
        }
      }
    }
  }

  // Applied to ones, col2im(im2col(.)) counts the windows covering each pixel.
  std::vector<float> ones(16, 1.0f);
  std::vector<float> windows(4 * 9);
  im2col(ones.data(), 1, 4, 4, 3, 0, 1, windows.data());
  std::vector<float> counts(16);
  col2im(windows.data(), 1, 4, 4, 3, 0, 1, counts.data());
  EXPECT_EQ(counts, (std::vector<float>{1, 2, 2, 1, 2, 4, 4, 2, 2, 4, 4, 2, 1, 2, 2, 1}));
}

TEST(PoolingLayerTest, SizesRoundUpAndAveragesCountPadding) {
  // Height 10, kernel 3, stride 2: ceil(7 / 2) + 1 = 5 rows (a convolution
  // gets 4); the last window holds rows 8 and 9 only. Values are 4 row + column.
  EXPECT_EQ(ForwardOn("type: POOLING pooling_param { kernel_size: 3 stride: 2 }", {1, 1, 10, 4},
                      Ramp(40)),
            (std::vector<float>{10, 11, 18, 19, 26, 27, 34, 35, 38, 39}));
  // Padding cells count in the divisor: the corner is (0 + 1 + 3 + 4) / 9.
  const std::vector<float> average = ForwardOn(
      "type: POOLING pooling_param { pool: AVE kernel_size: 3 pad: 1 }", {1, 1, 3, 3}, Ramp(9));
  EXPECT_FLOAT_EQ(average[0], 8.0f / 9.0f);
  EXPECT_FLOAT_EQ(average[4], 36.0f / 9.0f);
  // Width 5, kernel 1, stride 3: windows at 0, 3 and 6, the last outside the
  // image, where each method keeps its start value.
  EXPECT_EQ(ForwardOn("type: POOLING pooling_param { kernel_size: 1 stride: 3 }", {1, 1, 1, 5},
                      Ramp(5)),
            (std::vector<float>{0, 3, std::numeric_limits<float>::lowest()}));
  const float outside = ForwardOn("type: POOLING pooling_param { pool: AVE kernel_size: 1 "
                                  "stride: 3 }", {1, 1, 1, 5}, Ramp(5))[2];
  EXPECT_EQ(outside, 0.0f);
  EXPECT_TRUE(std::signbit(outside)) << "0 divided by a negative window size";

  // Max pooling of two images of two channels with NaNs among the values,
  // after a shrink to 9 by 7, against the window-by-window maximum.
  Blob<float> in(2, 2, 13, 11);
  OneLayer pool("type: POOLING pooling_param { kernel_size: 3 stride: 2 }", &in);
  in.RewriteShape(2, 2, 9, 7);
  FillUniform(&in, -5, 5);
  for (int i = 0; i < in.count(); i += 7) in.mutable_cpu_data()[i] = std::nanf("");
  pool.layer->AlterInputShape(7, 9, pool.bottom, &pool.top);
  ASSERT_EQ(Shape(pool.out), (std::vector<int>{2, 2, 4, 3}));
  const std::vector<float> pooled = pool.Forward();
  for (int plane = 0; plane < 4; ++plane) {
    for (int cell = 0; cell < 12; ++cell) {
      float expected = std::numeric_limits<float>::lowest();
      for (int h = cell / 3 * 2; h < std::min(cell / 3 * 2 + 3, 9); ++h) {
        for (int w = cell % 3 * 2; w < std::min(cell % 3 * 2 + 3, 7); ++w) {
          expected = std::fmax(expected, in.cpu_data()[plane * 63 + h * 7 + w]);
        }
      }
      EXPECT_EQ(pooled[plane * 12 + cell], expected) << plane << " " << cell;
    }
  }
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
  // Channels c - 1 to c + 1, none beyond the ends.
  ExpectNormalised(across.Forward(), x, {5, 25, 14, 29, 29, 14, 25, 5});
  // An even size is one short on the leading side: c - 1 to c + 2.
  ExpectNormalised(ForwardOn("type: LRN lrn_param { local_size: 4 alpha: 4 }", {1, 4, 1, 2}, x),
                   x, {14, 29, 30, 30, 29, 14, 25, 5});
  // Within a channel: a zero-padded 3 x 3 window, divided by its full size.
  ExpectNormalised(ForwardOn("type: LRN lrn_param { local_size: 3 alpha: 9 norm_region: "
                             "WITHIN_CHANNEL }", {1, 1, 1, 4}, {1, 2, 3, 4}),
                   {1, 2, 3, 4}, {5, 14, 29, 25});
}

TEST(InnerProductLayerTest, ImagesAreFlatRowsTimesTheWeightsPlusTheBias) {
  Blob<float> in(2, 1, 2, 2);
  SetValues(&in, Ramp(8));
  OneLayer ip("type: INNER_PRODUCT inner_product_param { num_output: 2 }", &in);
  ASSERT_EQ(Shape(*ip.layer->blobs()[0]), (std::vector<int>{1, 1, 2, 4}));
  SetValues(ip.layer->blobs()[0].get(), {1, 0, 0, 0, 0, 1, 1, 1});
  SetValues(ip.layer->blobs()[1].get(), {0, 10});
  EXPECT_EQ(ip.Forward(), (std::vector<float>{0, 16, 4, 28}));
}

TEST(PlumbingLayersTest, ConcatJoinsWhileSplitAndFlattenShare) {
  Blob<float> a(1, 2, 1, 2);
  Blob<float> b(1, 1, 1, 2);
  Blob<float> c(2, 2, 1, 2);
  SetValues(&a, Ramp(4));
  SetValues(&b, {10, 11});
  SetValues(&c, {20, 21, 22, 23, 24, 25, 26, 27});
  Blob<float> out;
  Blob<float> second;
  Blobs top = {&out};
  const struct {
    const char* param;
    Blobs bottom;
    std::vector<int> shape;
    std::vector<float> joined;
  } concats[] = {{"", {&a, &b}, {1, 3, 1, 2}, {0, 1, 2, 3, 10, 11}},
                 {"concat_param { concat_dim: 0 }", {&a, &c}, {3, 2, 1, 2},
                  {0, 1, 2, 3, 20, 21, 22, 23, 24, 25, 26, 27}}};
  for (const auto& concat : concats) {
    ConcatLayer<float> layer(Parse<LayerParameter>(concat.param));
    layer.SetUp(concat.bottom, &top);
    layer.Forward(concat.bottom, &top);
    EXPECT_EQ(Shape(out), concat.shape);
    EXPECT_EQ(Values(out), concat.joined);
  }

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
}

TEST(SoftmaxLayerTest, NormalisesEachPositionOfTheFirstImageOnly) {
  // Logits are logarithms of these, channel by channel: the first image has
  // 1, 2, 5 at its first position and 3, 3, 2 at its second, each summing to 8;
  // the second image's maximum is 8 too, but its positions sum to 7 and 11.
  const std::vector<float> e = {1, 3, 2, 3, 5, 2, 1, 8, 4, 2, 2, 1};
  std::vector<float> logits(12);
  std::transform(e.begin(), e.end(), logits.begin(), [](float v) { return std::log(v); });
  const std::vector<float> out = ForwardOn("type: SOFTMAX", {2, 3, 1, 2}, logits);
  for (int i = 0; i < 12; ++i) {
    EXPECT_NEAR(out[i], e[i] / 8, 1e-6) << i;
  }
  // One maximum for the whole image: the second position lies 200 below it,
  // so its exponentials underflow and give 0 / 0.
  const std::vector<float> probs = ForwardOn("type: SOFTMAX", {1, 2, 1, 2}, {0, -200, 1, -199});
  EXPECT_NEAR(probs[2], 1 / (1 + std::exp(-1.0)), 1e-6);
  EXPECT_TRUE(std::isnan(probs[1]));
}

TEST(NeuronLayersTest, ForwardFormulasAndTheirOverflows) {
  const std::vector<int> four = {1, 1, 1, 4};
  const std::vector<float> x = {-2.0f, 0.5f, 60.0f, std::numeric_limits<float>::quiet_NaN()};
  const std::vector<float> relu = ForwardOn("type: RELU", four, x);
  EXPECT_EQ(std::vector<float>(relu.begin(), relu.begin() + 3), (std::vector<float>{0, 0.5f, 60}));
  EXPECT_TRUE(std::isnan(relu[3])) << "a NaN stays NaN";
  EXPECT_FLOAT_EQ(ForwardOn("type: SIGMOID", four, x)[1], 1.0f / (1.0f + std::exp(-0.5f)));
  const std::vector<float> tanh = ForwardOn("type: TANH", four, x);
  EXPECT_FLOAT_EQ(tanh[0], std::tanh(-2.0f));
  EXPECT_TRUE(std::isnan(tanh[2])) << "exp(120) overflows: inf / inf";
  const std::vector<float> softplus = ForwardOn("type: BNLL", four, x);
  EXPECT_FLOAT_EQ(softplus[0], std::log1p(std::exp(-2.0f)));
  EXPECT_FLOAT_EQ(softplus[2], 60.0f);

  // Power: (shift + scale x) ^ power, with 1 for power 0 whatever the shift.
  const struct {
    const char* param;
    std::vector<float> expected;
  } powers[] = {{"power: 0 scale: 0 shift: 3", {1, 1, 1, 1}},
                {"power: 2 scale: 0 shift: 3", {9, 9, 9, 9}},
                {"power: 0.5 scale: 2 shift: 1", {std::sqrt(3.0f), std::sqrt(5.0f), 3, 1}},
                {"", {1, 2, 4, 0}}};
  for (const auto& p : powers) {
    EXPECT_EQ(ForwardOn(std::string("type: POWER power_param { ") + p.param + " }", four,
                        {1, 2, 4, 0}),
              p.expected)
        << p.param;
  }
}

TEST(NeuronLayersTest, DropoutScalesSurvivorsInTrainingAndCopiesInTesting) {
  Blob<float> x(1, 1, 20, 20);
  SetValues(&x, std::vector<float>(400, 1.0f));
  Engine::set_phase(Engine::TEST);
  OneLayer dropout("type: DROPOUT dropout_param { dropout_ratio: 0.75 }", &x);
  EXPECT_EQ(dropout.Forward(), std::vector<float>(400, 1.0f));

  Engine::set_phase(Engine::TRAIN);
  const std::vector<float> kept = dropout.Forward();
  EXPECT_EQ(std::count(kept.begin(), kept.end(), 0.0f) + std::count(kept.begin(), kept.end(), 4.0f),
            400);
  EXPECT_NEAR(std::count(kept.begin(), kept.end(), 4.0f), 100, 50);
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
