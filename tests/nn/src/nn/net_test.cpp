#include "nn/net.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <random>
#include <string>
#include <vector>

#include "blob_proto_maker.h"
#include "gradient_checker.h"
#include "nn/sgd_solver.h"
#include "nn/util/insert_splits.h"
#include "temp_dir.h"

namespace nn {
namespace {

// One input 1x1x4x4 and one convolution of two 3x3 outputs carrying its
// weights: all ones with bias 0.5 for channel 0, all twos with bias -1 for
// channel 1.
const char kConvNet[] = R"(
  input: "data" input_dim: 1 input_dim: 1 input_dim: 4 input_dim: 4
  layers { name: "conv" type: CONVOLUTION bottom: "data" top: "conv"
           convolution_param { num_output: 2 kernel_size: 3 }
           blobs { num: 2 channels: 1 height: 3 width: 3
                   data: [1, 1, 1, 1, 1, 1, 1, 1, 1, 2, 2, 2, 2, 2, 2, 2, 2, 2] }
           blobs { num: 1 channels: 1 height: 1 width: 2 data: [0.5, -1] } }
)";

TEST(NetTest, FFAddsTheFirstRunResponseFlatEvenAfterAShrink) {
  Net<float> net(kConvNet, NetDescription::kText);
  net.FirstRun();
  // The response to 100 everywhere: 900 + 0.5 and 1800 - 1, in every cell.
  Blob<float>* input = net.net_input_blobs()[0];
  EXPECT_EQ(input->cpu_data()[15], 100.0f);
  SetValues(input, Ramp(16));
  const Blob<float>& out = *net.FF()[0];
  // Window sums of the ramp 0..15 are 45, 54, 81, 90; the bias counts twice.
  EXPECT_EQ(Values(out), (std::vector<float>{45 + 901, 54 + 901, 81 + 901, 90 + 901, 90 + 1798,
                                             108 + 1798, 162 + 1798, 180 + 1798}));
  // At 3x3 each channel has one cell; element 1 (channel 1) meets element 1
  // of the stored response, which belongs to channel 0.
  net.AlterInputShape(3, 3);
  SetValues(input, Ramp(9));
  net.FF();
  EXPECT_EQ(Values(out), (std::vector<float>{36.0f + 0.5f + 900.5f, 72.0f - 1.0f + 900.5f}));
}

TEST(NetDeathTest, FirstRunStopsAtTheFirstConvolutionWhichFFWantsFirst) {
  Net<float> net(R"(
    input: "data" input_dim: 1 input_dim: 1 input_dim: 6 input_dim: 6
    layers { type: POOLING bottom: "data" top: "pool" pooling_param { pool: AVE kernel_size: 2 } }
    layers { type: CONVOLUTION bottom: "pool" top: "conv" convolution_param { num_output: 2
             kernel_size: 1 weight_filler { type: "constant" value: 1 } } }
    layers { type: RELU bottom: "conv" top: "conv" }
    layers { type: SOFTMAX bottom: "conv" top: "probs" })",
                 NetDescription::kText);
  net.FirstRun();
  EXPECT_EQ(net.blobs()[2]->cpu_data()[0], 100.0f) << "conv ran";
  EXPECT_EQ(net.output_blob()->cpu_data()[0], 0.0f) << "softmax did not";
  EXPECT_DEATH(net.FF(), "firstConvLayerIndex_ == 0 .*First Layer Should be Conv Layer.");
}

TEST(NetDeathTest, PassesRefuseTheWrongState) {
  const auto run = [](int first_runs, bool ff) {
    Net<float> net(kConvNet, NetDescription::kText);
    for (int i = 0; i < first_runs; ++i) {
      net.FirstRun();
    }
    ff ? net.FF() : net.Forward();
  };
  EXPECT_EXIT(run(0, true), testing::ExitedWithCode(255), "Invoke FirstRun\\(\\) before FF ");
  EXPECT_EXIT(run(2, true), testing::ExitedWithCode(255), "Invoke FirstRun\\(\\) twice");
  EXPECT_EXIT(run(1, false), testing::ExitedWithCode(255),
              "Should not Invoke FirstRun\\(\\) before FF ");
}

TEST(InsertSplitsTest, SharedBlobsGetASplitAndEachConsumerItsOwnTop) {
  NetParameter split;
  InsertSplits(Parse<NetParameter>(R"(input: "data"
    layers { name: "a" type: CONVOLUTION bottom: "data" top: "a" }
    layers { name: "relu" type: RELU bottom: "a" top: "a" }
    layers { name: "b" type: POOLING bottom: "data" top: "b" }
    layers { name: "c" type: CONCAT bottom: "a" bottom: "b" bottom: "a" top: "c" })"),
               &split);
  std::vector<std::string> wiring;  // name: bottoms > tops
  for (const LayerParameter& layer : split.layers()) {
    wiring.push_back(layer.name() + ":");
    for (const auto* names : {&layer.bottom(), &layer.top()}) {
      for (const std::string& name : *names) {
        wiring.back() += " " + name;
      }
      wiring.back() += names == &layer.bottom() ? " >" : "";
    }
  }
  // The first consumer works in place; a split follows the last producer.
  EXPECT_EQ(wiring, (std::vector<std::string>{
                        "input_data_0_split: data > data input_data_0_split_1", "a: data > a",
                        "relu: a > a", "relu_a_0_split: a > a relu_a_0_split_1",
                        "b: input_data_0_split_1 > b", "c: a b relu_a_0_split_1 > c"}));
  EXPECT_EQ(split.layers(0).type(), LayerParameter::SPLIT);

  EXPECT_DEATH(InsertSplits(Parse<NetParameter>("input: 'data' layers { name: 'a' bottom: "
                                                "'data' bottom: 'nothing' }"),
                            &split),
               "Unknown blob input nothing to layer 1");
}

TEST(NetTest, OutputsAreTheUnconsumedBlobsInNameOrder) {
  Net<float> net(R"(
    input: "data" input_dim: 1 input_dim: 2 input_dim: 1 input_dim: 1
    layers { name: "z" type: RELU bottom: "data" top: "zeta" }
    layers { name: "z2" type: SIGMOID bottom: "zeta" top: "zeta" }
    layers { name: "a" type: FLATTEN bottom: "zeta" top: "alpha" }
    layers { name: "m" type: TANH bottom: "alpha" top: "mid" }
    layers { name: "m2" type: RELU bottom: "mid" top: "mid" }
    layers { name: "b" type: SIGMOID bottom: "alpha" top: "beta" })",
                 NetDescription::kText);
  // alpha feeds two layers, so a split sits behind it.
  EXPECT_EQ(net.layer_names(),
            (std::vector<std::string>{"z", "z2", "a", "a_alpha_0_split", "m", "m2", "b"}));
  EXPECT_EQ(net.blob_names(), (std::vector<std::string>{"data", "zeta", "alpha",
                                                        "a_alpha_0_split_1", "mid", "beta"}));
  EXPECT_EQ(net.output_blobs(), (Blobs{net.blobs()[5].get(), net.blobs()[4].get()}));
  EXPECT_FALSE(net.output_blob()) << "no blob is named probs";
}

TEST(NetDeathTest, AssemblyRefusesBadDescriptions) {
  const std::string input = R"(input: "data" input_dim: 1 input_dim: 1 input_dim: 2 input_dim: 2 )";
  const std::string ip = R"(layers { name: "ip" type: INNER_PRODUCT bottom: "data" top: "ip"
                              inner_product_param { num_output: 1 } )";
  const struct {
    std::string net;
    const char* words;
  } cases[] = {
      {R"(input: "data" input_dim: 1)", "Incorrect bottom blob dimension specifications."},
      {input + R"(layers { name: "r" type: RELU bottom: "x" top: "r" })",
       "Unknown blob input x to layer 0"},
      {input + R"(layers { name: "r" type: RELU bottom: "data" top: "r" }
                  layers { name: "s" type: SIGMOID bottom: "r" top: "data" })",
       "Duplicate blobs produced by multiple sources."},
      {input + ip + "blobs_lr: 1 }", "Incorrect blobs lr size: should be either 0 or the same"},
      {input + ip + "blobs_lr: 1 blobs_lr: -1 }", "local_lr >= 0."},
      {input + ip + "weight_decay: 1 }",
       "layers_\\[i\\]->layer_param\\(\\).weight_decay_size\\(\\) == layer_blobs.size\\(\\)"},
      // No layer for HDF5: assembly ends at the missing layer.
      {input + R"(layers { name: "h" type: HDF5_DATA top: "h" })", "Layer h"},
  };
  for (const auto& c : cases) {
    EXPECT_DEATH(Net<float>(Parse<NetParameter>(c.net)), c.words) << c.net;
  }
}

const char kTwoLayerNet[] = R"(
  input: "data" input_dim: 2 input_dim: 3 input_dim: 1 input_dim: 1
  layers { name: "ip" type: INNER_PRODUCT bottom: "data" top: "ip"
           inner_product_param { num_output: 2 } }
  layers { name: "ip2" type: INNER_PRODUCT bottom: "ip" top: "ip2"
           inner_product_param { num_output: 1 weight_filler { type: "constant" value: 3 } } }
)";

TEST(NetTest, TrainedLayersAreCopiedByNameFromAWeightFile) {
  // A layer the net lacks is skipped; of two namesakes the later wins.
  auto weights = Parse<NetParameter>("layers { name: 'loss' blobs { width: 1 data: 5 } }");
  for (float value : {1.0f, 2.0f}) {
    LayerParameter* ip = weights.add_layers();
    ip->set_name("ip");
    *ip->add_blobs() = MakeBlob(1, 1, 2, 3, std::vector<float>(6, value));
    *ip->add_blobs() = MakeBlob(1, 1, 1, 2, {0.0f, value});
  }
  TempDir dir;
  Net<float> net(kTwoLayerNet, NetDescription::kText);
  net.CopyTrainedLayersFrom(dir.write("weights", weights.SerializeAsString()));
  SetValues(net.net_input_blobs()[0], std::vector<float>(6, 1.0f));
  // ip: (6, 8) per image; ip2 keeps its filled weights: 3 * 14 + 0 = 42.
  EXPECT_EQ(Values(*net.Forward()[0]), (std::vector<float>{42, 42}));

  // Shapes must agree field by field, and so must the number of blobs.
  weights.mutable_layers()->DeleteSubrange(0, 2);
  *weights.mutable_layers(0)->mutable_blobs(0) = MakeBlob(1, 1, 3, 2, std::vector<float>(6));
  EXPECT_DEATH(net.CopyTrainedLayersFrom(weights),
               "Check failed: target_blobs\\[j\\]->height\\(\\) == "
               "source_layer.blobs\\(j\\).height\\(\\) \\(2 vs. 3\\)");
  weights.mutable_layers(0)->mutable_blobs()->RemoveLast();
  EXPECT_DEATH(net.CopyTrainedLayersFrom(weights),
               "Check failed: target_blobs.size\\(\\) == source_layer.blobs_size\\(\\) .*"
               "Incompatible number of blobs for layer ip");
}

TEST(NetTest, AlterInputShapeDownAndBackRestoresEveryShapeAndResult) {
  Net<float> net(R"(
    input: "data" input_dim: 1 input_dim: 2 input_dim: 20 input_dim: 24
    layers { name: "conv" type: CONVOLUTION bottom: "data" top: "conv"
             convolution_param { num_output: 3 kernel_size: 3 pad: 1
               weight_filler { type: "gaussian" std: 0.3 }
               bias_filler { type: "gaussian" std: 0.3 } } }
    layers { name: "pool" type: POOLING bottom: "conv" top: "pool"
             pooling_param { kernel_size: 3 stride: 2 } }
    layers { name: "relu" type: RELU bottom: "pool" top: "pool" }
    layers { name: "norm" type: LRN bottom: "pool" top: "norm" lrn_param { local_size: 3 } }
    layers { name: "conv2" type: CONVOLUTION bottom: "norm" top: "conv2"
             convolution_param { num_output: 2 kernel_size: 2 stride: 2
               weight_filler { type: "gaussian" std: 0.3 } } }
    layers { name: "probs" type: SOFTMAX bottom: "conv2" top: "probs" })",
                 NetDescription::kText);
  net.FirstRun();
  const auto shapes = [&net] {
    std::vector<std::vector<int>> all;
    for (const auto& blob : net.blobs()) {
      all.push_back(Shape(*blob));
    }
    return all;
  };
  const auto declared = shapes();
  FillUniform(net.net_input_blobs()[0], -1.0f, 1.0f);
  const Blob<float>& probs = *net.output_blob();
  net.FF();
  const std::vector<float> before = Values(probs);

  // The padded conv keeps 9x11; pool and LRN: ceil(6/2)+1 = 4 rows, ceil(8/2)+1
  // = 5 columns; conv2 and softmax: (4-2)/2+1 = 2, (5-2)/2+1 = 2. No buffer moves.
  net.AlterInputShape(11, 9);
  EXPECT_EQ(shapes(), (std::vector<std::vector<int>>{{1, 2, 9, 11}, {1, 3, 9, 11}, {1, 3, 4, 5},
                                                     {1, 3, 4, 5}, {1, 2, 2, 2}, {1, 2, 2, 2}}));
  for (size_t i = 0; i < declared.size(); ++i) {
    const auto& d = declared[i];
    EXPECT_EQ(net.blobs()[i]->data()->size(), sizeof(float) * d[0] * d[1] * d[2] * d[3]);
  }
  net.FF();
  net.AlterInputShape(24, 20);
  EXPECT_EQ(shapes(), declared);
  FillUniform(net.net_input_blobs()[0], -1.0f, 1.0f);
  net.FF();
  EXPECT_EQ(Values(probs), before);
}

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
