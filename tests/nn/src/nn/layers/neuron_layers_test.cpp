#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <vector>

#include "gradient_checker.h"
#include "nn/engine.h"
#include "nn/neuron_layers.h"

namespace nn {
namespace {

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

TEST(NeuronLayersDeathTest, OneBottomAndOneTop) {
  Blob<float> a(1, 1, 1, 1);
  Blobs two = {&a, &a};
  Blobs one = {&a};
  EXPECT_DEATH(ReLULayer<float>(LayerParameter()).SetUp(two, &one),
               "Neuron Layer takes a single blob as input.");
  EXPECT_DEATH(ReLULayer<float>(LayerParameter()).SetUp(one, &two),
               "Neuron Layer takes a single blob as output.");
}

}  // namespace
}  // namespace nn
