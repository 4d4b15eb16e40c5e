#include <gtest/gtest.h>

#include <string>

#include "nn/proto/nn.pb.h"

namespace nn {
namespace {

TEST(NnProtoTest, DefaultsAreThoseTheTrainedModelsAssume) {
  const FillerParameter filler;
  EXPECT_EQ(filler.type(), "constant");
  EXPECT_EQ(filler.value(), 0.0f);
  EXPECT_EQ(filler.min(), 0.0f);
  EXPECT_EQ(filler.max(), 1.0f);
  EXPECT_EQ(filler.mean(), 0.0f);
  EXPECT_EQ(filler.std(), 1.0f);
  EXPECT_EQ(filler.sparse(), -1);

  const ConvolutionParameter conv;
  EXPECT_TRUE(conv.bias_term());
  EXPECT_EQ(conv.pad(), 0u);
  EXPECT_EQ(conv.group(), 1u);
  EXPECT_EQ(conv.stride(), 1u);
  EXPECT_FALSE(conv.has_kernel_size());

  const PoolingParameter pool;
  EXPECT_EQ(pool.pool(), PoolingParameter::MAX);
  EXPECT_EQ(pool.stride(), 1u);
  EXPECT_EQ(pool.pad(), 0u);

  const LRNParameter lrn;
  EXPECT_EQ(lrn.local_size(), 5u);
  EXPECT_EQ(lrn.alpha(), 1.0f);
  EXPECT_EQ(lrn.beta(), 0.75f);
  EXPECT_EQ(lrn.norm_region(), LRNParameter::ACROSS_CHANNELS);

  EXPECT_TRUE(InnerProductParameter().bias_term());
  EXPECT_EQ(ConcatParameter().concat_dim(), 1u);
  EXPECT_EQ(DropoutParameter().dropout_ratio(), 0.5f);
  const PowerParameter power;
  EXPECT_EQ(power.power(), 1.0f);
  EXPECT_EQ(power.scale(), 1.0f);
  EXPECT_EQ(power.shift(), 0.0f);
  EXPECT_EQ(DataParameter().scale(), 1.0f);
  EXPECT_FALSE(ImageDataParameter().shuffle());
  const WindowDataParameter window;
  EXPECT_EQ(window.fg_threshold(), 0.5f);
  EXPECT_EQ(window.fg_fraction(), 0.25f);
  EXPECT_EQ(window.crop_mode(), "warp");

  const SolverParameter solver;
  EXPECT_EQ(solver.solver_mode(), SolverParameter::GPU);
  EXPECT_EQ(solver.random_seed(), -1);
  EXPECT_FALSE(NetParameter().force_backward());

  const V0LayerParameter v0;
  EXPECT_TRUE(v0.biasterm());
  EXPECT_EQ(v0.pool(), V0LayerParameter::MAX);
  EXPECT_EQ(v0.local_size(), 5u);
  EXPECT_EQ(v0.det_crop_mode(), "warp");
  EXPECT_EQ(v0.concat_dim(), 1u);
}

TEST(NnProtoTest, LayerTypeNumbersAreThoseStoredInWeightFiles) {
  EXPECT_EQ(LayerParameter::NONE, 0);
  EXPECT_EQ(LayerParameter::ACCURACY, 1);
  EXPECT_EQ(LayerParameter::BNLL, 2);
  EXPECT_EQ(LayerParameter::CONCAT, 3);
  EXPECT_EQ(LayerParameter::CONVOLUTION, 4);
  EXPECT_EQ(LayerParameter::DATA, 5);
  EXPECT_EQ(LayerParameter::DROPOUT, 6);
  EXPECT_EQ(LayerParameter::EUCLIDEAN_LOSS, 7);
  EXPECT_EQ(LayerParameter::FLATTEN, 8);
  EXPECT_EQ(LayerParameter::HDF5_DATA, 9);
  EXPECT_EQ(LayerParameter::HDF5_OUTPUT, 10);
  EXPECT_EQ(LayerParameter::IM2COL, 11);
  EXPECT_EQ(LayerParameter::IMAGE_DATA, 12);
  EXPECT_EQ(LayerParameter::INFOGAIN_LOSS, 13);
  EXPECT_EQ(LayerParameter::INNER_PRODUCT, 14);
  EXPECT_EQ(LayerParameter::LRN, 15);
  EXPECT_EQ(LayerParameter::MULTINOMIAL_LOGISTIC_LOSS, 16);
  EXPECT_EQ(LayerParameter::POOLING, 17);
  EXPECT_EQ(LayerParameter::RELU, 18);
  EXPECT_EQ(LayerParameter::SIGMOID, 19);
  EXPECT_EQ(LayerParameter::SOFTMAX, 20);
  EXPECT_EQ(LayerParameter::SOFTMAX_LOSS, 21);
  EXPECT_EQ(LayerParameter::SPLIT, 22);
  EXPECT_EQ(LayerParameter::TANH, 23);
  EXPECT_EQ(LayerParameter::WINDOW_DATA, 24);
  EXPECT_EQ(LayerParameter::ELTWISE_PRODUCT, 25);
  EXPECT_EQ(LayerParameter::POWER, 26);
  EXPECT_EQ(LayerParameter::SIGMOID_CROSS_ENTROPY_LOSS, 27);
  EXPECT_EQ(LayerParameter::HINGE_LOSS, 28);
  EXPECT_EQ(LayerParameter::MEMORY_DATA, 29);
}

TEST(NnProtoTest, WeightsSurviveABinaryRoundTripInPackedForm) {
  NetParameter net;
  net.set_name("tiny");
  LayerParameter* layer = net.add_layers();
  layer->set_name("conv1");
  layer->set_type(LayerParameter::CONVOLUTION);
  BlobProto* blob = layer->add_blobs();
  blob->set_num(1);
  blob->set_channels(1);
  blob->set_height(1);
  blob->set_width(3);
  blob->add_data(1.5f);
  blob->add_data(-2.0f);
  blob->add_data(0.25f);

  std::string blob_bytes;
  ASSERT_TRUE(blob->SerializeToString(&blob_bytes));
  // Field 5, length-delimited, 12 bytes: the three floats packed together.
  EXPECT_NE(blob_bytes.find(std::string("\x2a\x0c", 2)), std::string::npos);

  std::string bytes;
  ASSERT_TRUE(net.SerializeToString(&bytes));
  NetParameter parsed;
  ASSERT_TRUE(parsed.ParseFromString(bytes));
  ASSERT_EQ(parsed.layers_size(), 1);
  EXPECT_EQ(parsed.name(), "tiny");
  EXPECT_EQ(parsed.layers(0).type(), LayerParameter::CONVOLUTION);
  EXPECT_EQ(parsed.layers(0).blobs(0).width(), 3);
  EXPECT_EQ(parsed.layers(0).blobs(0).data(1), -2.0f);
  EXPECT_FALSE(parsed.layers(0).has_layer());
}

}  // namespace
}  // namespace nn
