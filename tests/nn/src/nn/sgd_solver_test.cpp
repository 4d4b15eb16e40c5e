#include "nn/sgd_solver.h"

#include <gtest/gtest.h>

#include <random>
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
  layers { type: CONVOLUTION bottom: "data" top: "c1"
           convolution_param { num_output: 4 kernel_size: 3 } }
  layers { type: POOLING bottom: "c1" top: "p1" pooling_param { kernel_size: 3 stride: 2 } }
  layers { type: RELU bottom: "p1" top: "p1" }
  layers { type: LRN bottom: "p1" top: "n1" lrn_param { local_size: 3 alpha: 0.5 } }
  layers { type: INNER_PRODUCT bottom: "n1" top: "f1" inner_product_param { num_output: 5 } }
  layers { type: POOLING bottom: "data" top: "s"
           pooling_param { pool: AVE kernel_size: 3 stride: 2 } }
  layers { type: CONVOLUTION bottom: "s" top: "c2"
           convolution_param { num_output: 3 kernel_size: 3 } }
  layers { type: INNER_PRODUCT bottom: "c2" top: "f2" inner_product_param { num_output: 4 } }
  layers { type: CONCAT bottom: "f1" bottom: "f2" top: "both" }
  layers { type: INNER_PRODUCT bottom: "both" top: "f" inner_product_param { num_output: 3 } }
  layers { type: SOFTMAX bottom: "f" top: "probs" }
)";

TEST(NetBackwardTest, MatchesFiniteDifferencesThroughEveryCascadeLayerType) {
  Net<float> net(kCascadeLikeNet, NetDescription::kText);
  // Fixed weights, so that no run meets a kink of max pooling or ReLU
  // closer than the step.
  Blobs params;
  for (const auto& param : net.params()) {
    params.push_back(param.get());
    FillUniform(param.get(), -0.5f, 0.5f, 10 + static_cast<unsigned>(params.size()));
  }
  FillUniform(net.net_input_blobs()[0], -1.0f, 1.0f);
  const std::vector<float> weights = {0.7f, -1.3f, 0.4f};
  const auto objective = [&] {
    const float* out = net.Forward()[0]->cpu_data();
    return double(weights[0]) * out[0] + weights[1] * out[1] + weights[2] * out[2];
  };
  objective();
  std::copy(weights.begin(), weights.end(), net.output_blobs()[0]->mutable_cpu_diff());
  net.Backward();
  CheckDerivatives(params, objective, 1e-3f, 3e-3f);
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
  return Parse<SolverParameter>(
      "base_lr: 0.05 lr_policy: 'step' stepsize: 150 gamma: 0.5 momentum: 0.9 weight_decay: 1e-5");
}

// Batches of the regression up to the given iteration, each the same for the
// same iteration.
void TrainUpTo(int iterations, Net<float>& net, SGDSolver<float>& solver) {
  for (int iter = solver.iter(); iter < iterations; ++iter) {
    std::mt19937 random(static_cast<unsigned>(iter));
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
    net.Backward();
    solver.ApplyUpdate();
  }
}

TEST(SGDSolverTest, LearnsARegressionAndFollowsTheRateSchedule) {
  Net<float> net(kRegressionNet, NetDescription::kText);
  SGDSolver<float> solver(Settings(), &net);
  EXPECT_FLOAT_EQ(solver.LearningRate(), 0.05f);
  TrainUpTo(400, net, solver);
  EXPECT_EQ(solver.iter(), 400);
  EXPECT_FLOAT_EQ(solver.LearningRate(), 0.05f * 0.25f);  // two full steps of 150
  const std::vector<float> a = {2, 0, 0, -1, 0, 1, 3, 0};
  const std::vector<float> b = {0.5f, -1};
  for (int i = 0; i < 8; ++i) {
    EXPECT_NEAR(net.params()[0]->cpu_data()[i], a[i], 0.01f) << i;
    EXPECT_NEAR(net.params()[1]->cpu_data()[i % 2], b[i % 2], 0.01f);
  }
}

TEST(SGDSolverTest, ResumingFromASnapshotGivesTheUninterruptedWeights) {
  Net<float> straight(kRegressionNet, NetDescription::kText);
  SGDSolver<float> straight_solver(Settings(), &straight);
  TrainUpTo(40, straight, straight_solver);
  TempDir dir;
  {
    Net<float> first(kRegressionNet, NetDescription::kText);
    SGDSolver<float> solver(Settings(), &first);
    TrainUpTo(25, first, solver);
    solver.Snapshot(dir.path() + "/w", dir.path() + "/s");
  }
  Net<float> resumed(kRegressionNet, NetDescription::kText);
  SGDSolver<float> solver(Settings(), &resumed);
  solver.Restore(dir.path() + "/s");
  EXPECT_EQ(solver.iter(), 25);
  TrainUpTo(40, resumed, solver);
  for (size_t p = 0; p < straight.params().size(); ++p) {
    EXPECT_EQ(Values(*resumed.params()[p]), Values(*straight.params()[p])) << p;
  }
}

}  // namespace
}  // namespace nn
