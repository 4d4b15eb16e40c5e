#include "nn/net.h"

#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <string>
#include <vector>

#include "nn/engine.h"
#include "blob_proto_maker.h"
#include "gradient_checker.h"
#include "temp_dir.h"

namespace nn {
namespace {

NetParameter Parse(const std::string& text) {
  NetParameter param;
  EXPECT_TRUE(google::protobuf::TextFormat::ParseFromString(text, &param)) << text;
  return param;
}

// One input 1x1x4x4 and one convolution of two 3x3 outputs: all-ones weights
// with bias 0.5 for channel 0, all-twos with bias -1 for channel 1.
const char kConvNet[] = R"(
  input: "data" input_dim: 1 input_dim: 1 input_dim: 4 input_dim: 4
  layers { name: "conv" type: CONVOLUTION bottom: "data" top: "conv"
           convolution_param { num_output: 2 kernel_size: 3 } }
)";

NetParameter ConvWeights() {
  NetParameter weights;
  LayerParameter* conv = weights.add_layers();
  conv->set_name("conv");
  std::vector<float> w(18, 1.0f);
  std::fill(w.begin() + 9, w.end(), 2.0f);
  *conv->add_blobs() = MakeBlob(2, 1, 3, 3, w);
  *conv->add_blobs() = MakeBlob(1, 1, 1, 2, {0.5f, -1.0f});
  return weights;
}

void WriteRamp(Blob<float>* input) {
  for (int i = 0; i < input->count(); ++i) {
    input->mutable_cpu_data()[i] = static_cast<float>(i);
  }
}

TEST(NetTest, FFAddsTheFirstRunResponseFlatEvenAfterAShrink) {
  Net<float> net(Parse(kConvNet));
  net.CopyTrainedLayersFrom(ConvWeights());
  net.FirstRun();
  // The response to 100 everywhere: 900 + 0.5 and 1800 - 1, in every cell.
  Blob<float>* input = net.net_input_blobs()[0];
  EXPECT_EQ(input->cpu_data()[15], 100.0f);

  WriteRamp(input);
  const Blob<float>& out = *net.FF()[0];
  // Window sums of the ramp 0..15: 45, 54, 81, 90.
  const float sums[] = {45, 54, 81, 90};
  for (int i = 0; i < 4; ++i) {
    EXPECT_EQ(out.cpu_data()[i], sums[i] + 0.5f + 900.5f) << "bias counted twice";
    EXPECT_EQ(out.cpu_data()[4 + i], 2 * sums[i] - 1.0f + 1799.0f);
  }

  // At 3x3 each channel has one cell; element 1 (channel 1) meets element 1
  // of the stored response, which belongs to channel 0.
  net.AlterInputShape(3, 3);
  EXPECT_EQ(net.output_blobs()[0]->count(), 2);
  WriteRamp(input);
  net.FF();
  EXPECT_EQ(out.cpu_data()[0], 36.0f + 0.5f + 900.5f);
  EXPECT_EQ(out.cpu_data()[1], 72.0f - 1.0f + 900.5f);
}

TEST(NetDeathTest, PassesRefuseTheWrongState) {
  EXPECT_EXIT(
      {
        Net<float> net(Parse(kConvNet));
        net.FF();
      },
      testing::ExitedWithCode(255), "Invoke FirstRun\\(\\) before FF ");
  EXPECT_EXIT(
      {
        Net<float> net(Parse(kConvNet));
        net.FirstRun();
        net.FirstRun();
      },
      testing::ExitedWithCode(255), "Invoke FirstRun\\(\\) twice");
  EXPECT_EXIT(
      {
        Net<float> net(Parse(kConvNet));
        net.FirstRun();
        net.Forward();
      },
      testing::ExitedWithCode(255), "Should not Invoke FirstRun\\(\\) before FF ");

  // Two consumers of the input put a split layer in front of the convolution.
  EXPECT_DEATH(
      {
        Net<float> net(Parse(R"(
          input: "data" input_dim: 1 input_dim: 1 input_dim: 4 input_dim: 4
          layers { name: "conv" type: CONVOLUTION bottom: "data" top: "conv"
                   convolution_param { num_output: 1 kernel_size: 3 } }
          layers { name: "pool" type: POOLING bottom: "data" top: "pool"
                   pooling_param { kernel_size: 2 } }
        )"));
        net.FirstRun();
        net.FF();
      },
      "Check failed: firstConvLayerIndex_ == 0 .*First Layer Should be Conv Layer.");
}

TEST(NetTest, FirstRunStopsAtTheFirstConvolution) {
  Net<float> net(Parse(R"(
    input: "data" input_dim: 1 input_dim: 1 input_dim: 6 input_dim: 6
    layers { name: "pool" type: POOLING bottom: "data" top: "pool"
             pooling_param { pool: AVE kernel_size: 2 stride: 2 } }
    layers { name: "conv" type: CONVOLUTION bottom: "pool" top: "conv"
             convolution_param { num_output: 2 kernel_size: 1
               weight_filler { type: "constant" value: 1 } } }
    layers { name: "relu" type: RELU bottom: "conv" top: "conv" }
    layers { name: "probs" type: SOFTMAX bottom: "conv" top: "probs" }
  )"));
  net.FirstRun();
  EXPECT_EQ(net.blobs()[2]->cpu_data()[0], 100.0f) << "conv ran";
  EXPECT_EQ(net.output_blob()->cpu_data()[0], 0.0f) << "softmax did not";
}

TEST(NetTest, OutputsAreTheUnconsumedBlobsInNameOrder) {
  Net<float> net(Parse(R"(
    input: "data" input_dim: 1 input_dim: 2 input_dim: 1 input_dim: 1
    layers { name: "z" type: RELU bottom: "data" top: "zeta" }
    layers { name: "z2" type: SIGMOID bottom: "zeta" top: "zeta" }
    layers { name: "a" type: FLATTEN bottom: "zeta" top: "alpha" }
    layers { name: "m" type: TANH bottom: "alpha" top: "mid" }
    layers { name: "m2" type: RELU bottom: "mid" top: "mid" }
    layers { name: "b" type: SIGMOID bottom: "alpha" top: "beta" }
  )"));
  // alpha feeds two layers, so a split sits behind it.
  ASSERT_EQ(net.layers().size(), 7u);
  EXPECT_EQ(net.layer_names()[3], "a_alpha_0_split");
  ASSERT_EQ(net.output_blobs().size(), 2u);
  const auto& names = net.blob_names();
  const auto position = [&](const std::string& name) {
    return std::find(names.begin(), names.end(), name) - names.begin();
  };
  EXPECT_EQ(net.output_blobs()[0], net.blobs()[position("beta")].get());
  EXPECT_EQ(net.output_blobs()[1], net.blobs()[position("mid")].get());
  EXPECT_FALSE(net.output_blob()) << "no blob is named probs";
}

TEST(NetDeathTest, AssemblyRefusesBadDescriptions) {
  const std::string input = R"(input: "data" input_dim: 1 input_dim: 1 input_dim: 2 input_dim: 2 )";
  EXPECT_DEATH(Net<float>(Parse(R"(input: "data" input_dim: 1)")),
               "param.input_size\\(\\) \\* 4 == param.input_dim_size\\(\\) .*Incorrect bottom "
               "blob dimension specifications.");
  EXPECT_DEATH(Net<float>(Parse(input + R"(layers { name: "r" type: RELU bottom: "x" top: "r" })")),
               "Unknown blob input x to layer 0");
  EXPECT_DEATH(Net<float>(Parse(input + R"(
                 layers { name: "r" type: RELU bottom: "data" top: "r" }
                 layers { name: "s" type: SIGMOID bottom: "r" top: "data" })")),
               "Duplicate blobs produced by multiple sources.");
  const std::string ip = R"(layers { name: "ip" type: INNER_PRODUCT bottom: "data" top: "ip"
                              inner_product_param { num_output: 1 } )";
  EXPECT_DEATH(Net<float>(Parse(input + ip + "blobs_lr: 1 }")),
               "Check failed: blobs_lr_size == layers_\\[i\\]->blobs\\(\\).size\\(\\) \\|\\| "
               "blobs_lr_size == 0 Incorrect blobs lr size");
  EXPECT_DEATH(Net<float>(Parse(input + ip + "blobs_lr: 1 blobs_lr: -1 }")),
               "Check failed: local_lr >= 0. ");
  EXPECT_DEATH(Net<float>(Parse(input + ip + "weight_decay: 1 }")),
               "layers_\\[i\\]->layer_param\\(\\).weight_decay_size\\(\\) == layer_blobs.size\\(\\)");
  EXPECT_DEATH(Net<float>(Parse(input + R"(layers { name: "n" bottom: "data" top: "n" })")),
               "Layer n has unspecified type.");
  EXPECT_DEATH(
      Net<float>(Parse(input + R"(layers { name: "w" type: WINDOW_DATA top: "w" })")),
      "Layer w has unknown type 24");
  EXPECT_DEATH(Net<float>(Parse(input + R"(layers { name: "h" type: HDF5_DATA top: "h" })")),
               "Layer h");
}

const char kTwoLayerNet[] = R"(
  input: "data" input_dim: 2 input_dim: 3 input_dim: 1 input_dim: 1
  layers { name: "ip" type: INNER_PRODUCT bottom: "data" top: "ip"
           inner_product_param { num_output: 2 } }
  layers { name: "ip2" type: INNER_PRODUCT bottom: "ip" top: "ip2"
           inner_product_param { num_output: 1 weight_filler { type: "constant" value: 3 } } }
)";

TEST(NetTest, TrainedLayersAreCopiedByNameFromAWeightFile) {
  NetParameter weights;
  LayerParameter* unknown = weights.add_layers();
  unknown->set_name("loss");  // not in the net: skipped
  *unknown->add_blobs() = MakeBlob(1, 1, 1, 1, {5});
  for (float value : {1.0f, 2.0f}) {  // the later of two namesakes wins
    LayerParameter* ip = weights.add_layers();
    ip->set_name("ip");
    *ip->add_blobs() = MakeBlob(1, 1, 2, 3, std::vector<float>(6, value));
    *ip->add_blobs() = MakeBlob(1, 1, 1, 2, {0.0f, value});
  }
  TempDir dir;
  const std::string path = dir.write("weights", weights.SerializeAsString());

  Net<float> net(Parse(kTwoLayerNet));
  net.CopyTrainedLayersFrom(path);
  EXPECT_EQ(net.layers()[0]->blobs()[0]->cpu_data()[5], 2.0f);
  EXPECT_EQ(net.layers()[0]->blobs()[1]->cpu_data()[1], 2.0f);
  EXPECT_EQ(net.layers()[1]->blobs()[0]->cpu_data()[0], 3.0f) << "ip2 keeps its filled weights";

  float* input = net.net_input_blobs()[0]->mutable_cpu_data();
  for (int i = 0; i < 6; ++i) {
    input[i] = 1.0f;
  }
  const Blob<float>& out = *net.Forward()[0];
  // ip: (6, 8) per image; ip2: 3 * 14 + 0 = 42.
  EXPECT_EQ(out.cpu_data()[0], 42.0f);
  EXPECT_EQ(out.cpu_data()[1], 42.0f);
}

TEST(NetDeathTest, TrainedLayersMustMatchInShape) {
  NetParameter swapped;
  LayerParameter* ip = swapped.add_layers();
  ip->set_name("ip");
  *ip->add_blobs() = MakeBlob(1, 1, 3, 2, std::vector<float>(6, 1.0f));
  *ip->add_blobs() = MakeBlob(1, 1, 1, 2, {0, 0});
  EXPECT_DEATH(Net<float>(Parse(kTwoLayerNet)).CopyTrainedLayersFrom(swapped),
               "Check failed: target_blobs\\[j\\]->height\\(\\) == "
               "source_layer.blobs\\(j\\).height\\(\\) \\(2 vs. 3\\)");
  ip->mutable_blobs()->RemoveLast();
  EXPECT_DEATH(Net<float>(Parse(kTwoLayerNet)).CopyTrainedLayersFrom(swapped),
               "Check failed: target_blobs.size\\(\\) == source_layer.blobs_size\\(\\) .*"
               "Incompatible number of blobs for layer ip");
}

TEST(NetTest, AlterInputShapeDownAndBackRestoresEveryShapeAndResult) {
  Net<float> net(Parse(R"(
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
    layers { name: "probs" type: SOFTMAX bottom: "conv2" top: "probs" }
  )"));
  net.FirstRun();
  std::vector<std::vector<int>> declared;
  for (const auto& blob : net.blobs()) {
    declared.push_back({blob->num(), blob->channels(), blob->height(), blob->width()});
  }
  FillUniform(net.net_input_blobs()[0], -1.0f, 1.0f);
  const Blob<float>& probs = *net.output_blob();
  net.FF();
  const std::vector<float> before(probs.cpu_data(), probs.cpu_data() + probs.count());

  net.AlterInputShape(11, 9);
  // conv keeps 9x11; pool: ceil(6/2)+1 = 4 rows, ceil(8/2)+1 = 5 columns;
  // conv2: (4-2)/2+1 = 2, (5-2)/2+1 = 2.
  EXPECT_EQ(net.blobs()[2]->height(), 4);
  EXPECT_EQ(net.blobs()[2]->width(), 5);
  EXPECT_EQ(probs.height(), 2);
  EXPECT_EQ(probs.width(), 2);
  EXPECT_EQ(probs.data()->size(), declared.back()[1] * declared.back()[2] * declared.back()[3] *
                                      sizeof(float))
      << "storage keeps the declared size";
  net.FF();

  net.AlterInputShape(24, 20);
  for (size_t i = 0; i < net.blobs().size(); ++i) {
    const auto& blob = net.blobs()[i];
    EXPECT_EQ(std::vector<int>({blob->num(), blob->channels(), blob->height(), blob->width()}),
              declared[i])
        << net.blob_names()[i];
  }
  FillUniform(net.net_input_blobs()[0], -1.0f, 1.0f);
  net.FF();
  EXPECT_EQ(std::vector<float>(probs.cpu_data(), probs.cpu_data() + probs.count()), before);
}

}  // namespace
}  // namespace nn
