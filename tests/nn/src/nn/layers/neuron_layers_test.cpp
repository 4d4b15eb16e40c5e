#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <memory>
#include <vector>

#include "gradient_checker.h"
#include "nn/engine.h"
#include "nn/neuron_layers.h"

namespace nn {
namespace {

struct NeuronFixture {
  explicit NeuronFixture(const std::vector<float>& values) : in(1, 1, 1, values.size()) {
    std::copy(values.begin(), values.end(), in.mutable_cpu_data());
  }
  std::vector<float> Run(Layer<float>* layer) {
    layer->SetUp(bottom, &top);
    layer->Forward(bottom, &top);
    return {out.cpu_data(), out.cpu_data() + out.count()};
  }
  Blob<float> in;
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
};

LayerParameter PowerParam(float power, float scale, float shift) {
  LayerParameter param;
  param.mutable_power_param()->set_power(power);
  param.mutable_power_param()->set_scale(scale);
  param.mutable_power_param()->set_shift(shift);
  return param;
}

TEST(NeuronLayersTest, ForwardFormulas) {
  const float nan = std::numeric_limits<float>::quiet_NaN();
  NeuronFixture fixture({-2.0f, 0.0f, 1.5f, nan});
  ReLULayer<float> relu{LayerParameter()};
  const std::vector<float> rectified = fixture.Run(&relu);
  EXPECT_EQ(rectified[0], 0.0f);
  EXPECT_EQ(rectified[2], 1.5f);
  EXPECT_TRUE(std::isnan(rectified[3])) << "a NaN stays NaN";

  NeuronFixture x({-2.0f, 0.5f, 60.0f});
  SigmoidLayer<float> sigmoid{LayerParameter()};
  EXPECT_FLOAT_EQ(x.Run(&sigmoid)[1], 1.0f / (1.0f + std::exp(-0.5f)));
  TanHLayer<float> tanh_layer{LayerParameter()};
  const std::vector<float> tanh = x.Run(&tanh_layer);
  EXPECT_FLOAT_EQ(tanh[0], std::tanh(-2.0f));
  EXPECT_TRUE(std::isnan(tanh[2])) << "exp(120) overflows: inf / inf";
  BNLLLayer<float> bnll{LayerParameter()};
  const std::vector<float> softplus = x.Run(&bnll);
  EXPECT_FLOAT_EQ(softplus[0], std::log1p(std::exp(-2.0f)));
  EXPECT_FLOAT_EQ(softplus[2], 60.0f);
}

TEST(NeuronLayersTest, PowerTakesEachShortcut) {
  NeuronFixture x({1.0f, 2.0f, 4.0f});
  PowerLayer<float> constant(PowerParam(0.0f, 0.0f, 3.0f));
  EXPECT_EQ(x.Run(&constant), (std::vector<float>{1, 1, 1})) << "power 0: 1 whatever the shift";
  PowerLayer<float> shifted(PowerParam(2.0f, 0.0f, 3.0f));
  EXPECT_EQ(x.Run(&shifted), (std::vector<float>{9, 9, 9}));
  PowerLayer<float> full(PowerParam(0.5f, 2.0f, 1.0f));
  EXPECT_EQ(x.Run(&full), (std::vector<float>{std::sqrt(3.0f), std::sqrt(5.0f), 3.0f}));
  PowerLayer<float> identity{LayerParameter()};
  EXPECT_EQ(x.Run(&identity), (std::vector<float>{1, 2, 4}));
}

TEST(NeuronLayersTest, ReLUInPlaceOverwritesItsBottom) {
  NeuronFixture x({-1.0f, 2.0f});
  std::vector<Blob<float>*> same = {&x.in};
  ReLULayer<float> relu{LayerParameter()};
  relu.SetUp(x.bottom, &same);
  relu.Forward(x.bottom, &same);
  EXPECT_EQ(x.in.cpu_data()[0], 0.0f);
}

TEST(NeuronLayersTest, GradientsMatchFiniteDifferences) {
  std::vector<std::unique_ptr<Layer<float>>> layers;
  layers.emplace_back(new ReLULayer<float>(LayerParameter()));
  layers.emplace_back(new SigmoidLayer<float>(LayerParameter()));
  layers.emplace_back(new TanHLayer<float>(LayerParameter()));
  layers.emplace_back(new BNLLLayer<float>(LayerParameter()));
  layers.emplace_back(new PowerLayer<float>(PowerParam(2.0f, 0.7f, 0.4f)));
  layers.emplace_back(new PowerLayer<float>(PowerParam(-0.75f, 0.3f, 1.0f)));
  layers.emplace_back(new PowerLayer<float>(PowerParam(1.5f, 0.5f, 0.0f)));
  layers.emplace_back(new PowerLayer<float>(PowerParam(1.0f, 2.0f, 1.0f)));
  for (auto& layer : layers) {
    Blob<float> in(2, 3, 2, 2);
    FillUniform(&in, 0.1f, 2.0f);  // positive, away from the kinks
    Blob<float> out;
    std::vector<Blob<float>*> bottom = {&in};
    std::vector<Blob<float>*> top = {&out};
    layer->SetUp(bottom, &top);
    GradientChecker(1e-3f, 1e-2f).Check(layer.get(), bottom, &top);
  }
}

TEST(NeuronLayersTest, DropoutScalesSurvivorsInTrainingAndCopiesInTesting) {
  LayerParameter param;
  param.mutable_dropout_param()->set_dropout_ratio(0.75f);
  NeuronFixture x(std::vector<float>(400, 1.0f));
  DropoutLayer<float> dropout(param);
  Engine::set_phase(Engine::TEST);
  EXPECT_EQ(x.Run(&dropout), std::vector<float>(400, 1.0f));

  Engine::set_phase(Engine::TRAIN);
  const std::vector<float> kept = x.Run(&dropout);
  int survivors = 0;
  for (float v : kept) {
    ASSERT_TRUE(v == 0.0f || v == 4.0f) << v;
    survivors += v != 0.0f;
  }
  EXPECT_GT(survivors, 50);
  EXPECT_LT(survivors, 150);
  std::fill(x.out.mutable_cpu_diff(), x.out.mutable_cpu_diff() + 400, 0.5f);
  dropout.Backward(x.top, true, &x.bottom);
  for (int i = 0; i < 400; ++i) {
    ASSERT_EQ(x.in.cpu_diff()[i], kept[i] * 0.5f) << "the same mask on the way back";
  }
  Engine::set_phase(Engine::TEST);
  EXPECT_DEATH(dropout.Backward(x.top, true, &x.bottom),
               "Check failed: Engine::phase\\(\\) == Engine::TRAIN ");
}

TEST(NeuronLayersDeathTest, OneBottomAndOneTop) {
  Blob<float> a(1, 1, 1, 1);
  std::vector<Blob<float>*> two = {&a, &a};
  std::vector<Blob<float>*> one = {&a};
  EXPECT_DEATH(ReLULayer<float>(LayerParameter()).SetUp(two, &one),
               "Neuron Layer takes a single blob as input.");
  EXPECT_DEATH(ReLULayer<float>(LayerParameter()).SetUp(one, &two),
               "Neuron Layer takes a single blob as output.");
}

}  // namespace
}  // namespace nn
