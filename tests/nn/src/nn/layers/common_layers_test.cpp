#include "nn/common_layers.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <numeric>
#include <string>
#include <vector>

#include "gradient_checker.h"
#include "nn/engine.h"
#include "nn/neuron_layers.h"

namespace nn {
namespace {

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
