#include "nn/sgd_solver.h"

#include <gtest/gtest.h>

#include <cmath>
#include <random>
#include <string>
#include <vector>

#include "gradient_checker.h"
#include "temp_dir.h"

namespace nn {
namespace {

// Every layer type of the cascade nets: two branches on the input (one
// through an average pool, so the input gets a split), convolution, max
// pooling, ReLU in place, LRN, inner products, concatenation and softmax.
const char kCascadeLikeNet[] = R"(
  input: "data" input_dim: 1 input_dim: 3 input_dim: 10 input_dim: 10
  layers { name: "conv1" type: CONVOLUTION bottom: "data" top: "conv1"
           convolution_param { num_output: 4 kernel_size: 3 stride: 1
             weight_filler { type: "gaussian" std: 0.3 } bias_filler { type: "constant" value: 0.1 } } }
  layers { name: "pool1" type: POOLING bottom: "conv1" top: "pool1"
           pooling_param { pool: MAX kernel_size: 3 stride: 2 } }
  layers { name: "relu1" type: RELU bottom: "pool1" top: "pool1" }
  layers { name: "norm1" type: LRN bottom: "pool1" top: "norm1"
           lrn_param { local_size: 3 alpha: 0.5 beta: 0.75 } }
  layers { name: "fc1" type: INNER_PRODUCT bottom: "norm1" top: "fc1"
           inner_product_param { num_output: 5
             weight_filler { type: "gaussian" std: 0.3 } bias_filler { type: "constant" value: 0.1 } } }
  layers { name: "small" type: POOLING bottom: "data" top: "small"
           pooling_param { pool: AVE kernel_size: 3 stride: 2 } }
  layers { name: "conv2" type: CONVOLUTION bottom: "small" top: "conv2"
           convolution_param { num_output: 3 kernel_size: 3
             weight_filler { type: "gaussian" std: 0.3 } bias_filler { type: "constant" value: 0.1 } } }
  layers { name: "fc2" type: INNER_PRODUCT bottom: "conv2" top: "fc2"
           inner_product_param { num_output: 4
             weight_filler { type: "gaussian" std: 0.3 } bias_filler { type: "constant" value: 0.1 } } }
  layers { name: "both" type: CONCAT bottom: "fc1" bottom: "fc2" top: "both" }
  layers { name: "fcf" type: INNER_PRODUCT bottom: "both" top: "fcf"
           inner_product_param { num_output: 3
             weight_filler { type: "gaussian" std: 0.3 } bias_filler { type: "constant" value: 0.1 } } }
  layers { name: "probs" type: SOFTMAX bottom: "fcf" top: "probs" }
)";

double WeightedOutput(Net<float>& net, const std::vector<float>& weights) {
  const Blob<float>& out = *net.Forward()[0];
  double sum = 0.0;
  for (int i = 0; i < out.count(); ++i) {
    sum += weights[i] * out.cpu_data()[i];
  }
  return sum;
}

TEST(NetBackwardTest, MatchesFiniteDifferencesThroughEveryCascadeLayerType) {
  Net<float> net(kCascadeLikeNet, NetDescription::kText);
  // Fixed weights, so that no run meets a kink of max pooling or ReLU
  // closer than the step.
  unsigned seed = 11;
  for (const auto& param : net.params()) {
    FillUniform(param.get(), -0.5f, 0.5f, seed++);
  }
  FillUniform(net.net_input_blobs()[0], -1.0f, 1.0f);
  const std::vector<float> weights = {0.7f, -1.3f, 0.4f};
  WeightedOutput(net, weights);
  Blob<float>& out = *net.output_blobs()[0];
  std::copy(weights.begin(), weights.end(), out.mutable_cpu_diff());
  net.Backward();

  const float step = 1e-3f;
  for (const auto& param : net.params()) {
    const std::vector<float> analytic(param->cpu_diff(), param->cpu_diff() + param->count());
    for (int k = 0; k < param->count(); ++k) {
      float* data = param->mutable_cpu_data();
      const float original = data[k];
      data[k] = original + step;
      const double plus = WeightedOutput(net, weights);
      data[k] = original - step;
      const double minus = WeightedOutput(net, weights);
      data[k] = original;
      const double numeric = (plus - minus) / (2.0 * step);
      EXPECT_NEAR(analytic[k], numeric, 2e-3 + 2e-2 * std::fabs(numeric)) << "element " << k;
    }
  }
}

// Learns y = A x + b from batches through a Euclidean loss, from all-zero
// weights.
const char kRegressionNet[] = R"(
  input: "data" input_dim: 8 input_dim: 4 input_dim: 1 input_dim: 1
  input: "target" input_dim: 8 input_dim: 2 input_dim: 1 input_dim: 1
  layers { name: "fc" type: INNER_PRODUCT bottom: "data" top: "fc"
           blobs_lr: 1 blobs_lr: 2 weight_decay: 1 weight_decay: 0
           inner_product_param { num_output: 2 } }
  layers { name: "loss" type: EUCLIDEAN_LOSS bottom: "fc" bottom: "target" }
)";

SolverParameter Settings() {
  SolverParameter param;
  param.set_base_lr(0.05f);
  param.set_lr_policy("step");
  param.set_stepsize(150);
  param.set_gamma(0.5f);
  param.set_momentum(0.9f);
  param.set_weight_decay(1e-5f);
  return param;
}

// One batch of the regression, the same for the same iteration.
double RegressionStep(Net<float>& net, SGDSolver<float>& solver) {
  std::mt19937 random(static_cast<unsigned>(solver.iter()));
  std::uniform_real_distribution<float> draw(-1.0f, 1.0f);
  float* x = net.net_input_blobs()[0]->mutable_cpu_data();
  float* y = net.net_input_blobs()[1]->mutable_cpu_data();
  for (int n = 0; n < 8; ++n) {
    for (int i = 0; i < 4; ++i) {
      x[4 * n + i] = draw(random);
    }
    y[2 * n] = 2.0f * x[4 * n] - x[4 * n + 3] + 0.5f;
    y[2 * n + 1] = x[4 * n + 1] + 3.0f * x[4 * n + 2] - 1.0f;
  }
  net.Forward();
  const float* fit = net.blobs()[net.blobs().size() - 1]->cpu_data();
  double loss = 0.0;
  for (int i = 0; i < 16; ++i) {
    loss += 0.5 * (fit[i] - y[i]) * (fit[i] - y[i]) / 8.0;
  }
  net.Backward();
  solver.ApplyUpdate();
  return loss;
}

TEST(SGDSolverTest, LearnsARegressionAndFollowsTheRateSchedule) {
  Net<float> net(kRegressionNet, NetDescription::kText);
  SGDSolver<float> solver(Settings(), &net);
  EXPECT_FLOAT_EQ(solver.LearningRate(), 0.05f);
  const double first = RegressionStep(net, solver);
  double last = first;
  for (int i = 1; i < 400; ++i) {
    last = RegressionStep(net, solver);
  }
  EXPECT_GT(first, 1.0);
  EXPECT_LT(last, 1e-4);
  EXPECT_EQ(solver.iter(), 400);
  EXPECT_FLOAT_EQ(solver.LearningRate(), 0.05f * 0.25f);  // two full steps of 150
  const Blob<float>& bias = *net.params()[1];
  EXPECT_NEAR(bias.cpu_data()[0], 0.5f, 0.01f);
  EXPECT_NEAR(bias.cpu_data()[1], -1.0f, 0.01f);
}

TEST(SGDSolverTest, ResumingFromASnapshotGivesTheUninterruptedWeights) {
  Net<float> straight(kRegressionNet, NetDescription::kText);
  SGDSolver<float> straightSolver(Settings(), &straight);
  for (int i = 0; i < 40; ++i) {
    RegressionStep(straight, straightSolver);
  }

  TempDir dir;
  {
    Net<float> first(kRegressionNet, NetDescription::kText);
    SGDSolver<float> solver(Settings(), &first);
    for (int i = 0; i < 25; ++i) {
      RegressionStep(first, solver);
    }
    solver.Snapshot(dir.path() + "/w", dir.path() + "/s");
  }
  Net<float> resumed(kRegressionNet, NetDescription::kText);
  SGDSolver<float> solver(Settings(), &resumed);
  solver.Restore(dir.path() + "/s");
  EXPECT_EQ(solver.iter(), 25);
  for (int i = 25; i < 40; ++i) {
    RegressionStep(resumed, solver);
  }
  for (size_t p = 0; p < straight.params().size(); ++p) {
    for (int k = 0; k < straight.params()[p]->count(); ++k) {
      EXPECT_EQ(resumed.params()[p]->cpu_data()[k], straight.params()[p]->cpu_data()[k]);
    }
  }
}

}  // namespace
}  // namespace nn
