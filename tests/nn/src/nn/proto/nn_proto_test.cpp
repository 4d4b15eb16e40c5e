#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <typeinfo>
#include <vector>

#include "gradient_checker.h"
#include "nn/common_layers.h"
#include "nn/data_layers.h"
#include "nn/loss_layers.h"
#include "nn/neuron_layers.h"
#include "nn/proto/nn.pb.h"
#include "nn/vision_layers.h"

namespace nn {
namespace {

// Every field set in `expected` is what a message that never set it reads.
template <typename Proto>
void ExpectDefaults(const std::string& expected_text) {
  const Proto expected = Parse<Proto>(expected_text);
  const Proto unset;
  std::vector<const google::protobuf::FieldDescriptor*> fields;
  expected.GetReflection()->ListFields(expected, &fields);
  for (const auto* field : fields) {
    std::string want, got;
    google::protobuf::TextFormat::PrintFieldValueToString(expected, field, -1, &want);
    google::protobuf::TextFormat::PrintFieldValueToString(unset, field, -1, &got);
    EXPECT_EQ(got, want) << field->full_name();
  }
}

TEST(NnProtoTest, DefaultsAreThoseTheTrainedModelsAssume) {
  ExpectDefaults<FillerParameter>(
      "type: 'constant' value: 0 min: 0 max: 1 mean: 0 std: 1 sparse: -1");
  ExpectDefaults<ConvolutionParameter>("bias_term: true pad: 0 group: 1 stride: 1");
  ExpectDefaults<PoolingParameter>("pool: MAX stride: 1 pad: 0");
  ExpectDefaults<LRNParameter>("local_size: 5 alpha: 1 beta: 0.75 norm_region: ACROSS_CHANNELS");
  ExpectDefaults<InnerProductParameter>("bias_term: true");
  ExpectDefaults<ConcatParameter>("concat_dim: 1");
  ExpectDefaults<DropoutParameter>("dropout_ratio: 0.5");
  ExpectDefaults<PowerParameter>("power: 1 scale: 1 shift: 0");
  ExpectDefaults<DataParameter>("scale: 1 crop_size: 0 mirror: false rand_skip: 0");
  ExpectDefaults<ImageDataParameter>("shuffle: false new_height: 0 new_width: 0");
  ExpectDefaults<WindowDataParameter>("fg_threshold: 0.5 fg_fraction: 0.25 crop_mode: 'warp'");
  ExpectDefaults<SolverParameter>("solver_mode: GPU random_seed: -1");
  ExpectDefaults<NetParameter>("force_backward: false");
  ExpectDefaults<V0LayerParameter>(
      "biasterm: true pool: MAX local_size: 5 det_crop_mode: 'warp' concat_dim: 1");
  EXPECT_FALSE(ConvolutionParameter().has_kernel_size());
}

TEST(NnProtoTest, BlobValuesArePackedOnTheWire) {
  BlobProto blob = Parse<BlobProto>("num: 1 channels: 1 height: 1 width: 3 data: [1.5, -2, 0.25]");
  // Field 5, length-delimited, 12 bytes: the three floats packed together.
  EXPECT_NE(blob.SerializeAsString().find(std::string("\x2a\x0c", 2)), std::string::npos);
  BlobProto parsed;
  ASSERT_TRUE(parsed.ParseFromString(blob.SerializeAsString()));
  EXPECT_EQ(parsed.DebugString(), blob.DebugString());
}

LayerParameter Param(int type) {
  LayerParameter param;
  param.set_name("x");
  param.set_type(static_cast<LayerParameter::LayerType>(type));
  return param;
}

// The numbers are those stored in weight files; each gets its class.
TEST(LayerFactoryTest, EveryTypeNumberOfTheSchemaGetsItsClass) {
  const struct {
    const char* name;
    int number;
    const std::type_info* type;  // null: no layer
  } types[] = {
      {"ACCURACY", 1, &typeid(AccuracyLayer<float>)}, {"BNLL", 2, &typeid(BNLLLayer<float>)},
      {"CONCAT", 3, &typeid(ConcatLayer<float>)}, {"CONVOLUTION", 4, &typeid(ConvolutionLayer<float>)},
      {"DATA", 5, &typeid(DataLayer<float>)}, {"DROPOUT", 6, &typeid(DropoutLayer<float>)},
      {"EUCLIDEAN_LOSS", 7, &typeid(EuclideanLossLayer<float>)},
      {"FLATTEN", 8, &typeid(FlattenLayer<float>)}, {"HDF5_DATA", 9, nullptr},
      {"HDF5_OUTPUT", 10, nullptr}, {"IM2COL", 11, &typeid(Im2colLayer<float>)},
      {"IMAGE_DATA", 12, &typeid(ImageDataLayer<float>)},
      {"INFOGAIN_LOSS", 13, &typeid(InfogainLossLayer<float>)},
      {"INNER_PRODUCT", 14, &typeid(InnerProductLayer<float>)}, {"LRN", 15, &typeid(LRNLayer<float>)},
      {"MULTINOMIAL_LOGISTIC_LOSS", 16, &typeid(MultinomialLogisticLossLayer<float>)},
      {"POOLING", 17, &typeid(PoolingLayer<float>)}, {"RELU", 18, &typeid(ReLULayer<float>)},
      {"SIGMOID", 19, &typeid(SigmoidLayer<float>)}, {"SOFTMAX", 20, &typeid(SoftmaxLayer<float>)},
      {"SOFTMAX_LOSS", 21, &typeid(SoftmaxWithLossLayer<float>)},
      {"SPLIT", 22, &typeid(SplitLayer<float>)}, {"TANH", 23, &typeid(TanHLayer<float>)},
      {"ELTWISE_PRODUCT", 25, &typeid(EltwiseProductLayer<float>)},
      {"POWER", 26, &typeid(PowerLayer<float>)},
      {"SIGMOID_CROSS_ENTROPY_LOSS", 27, &typeid(SigmoidCrossEntropyLossLayer<float>)},
      {"HINGE_LOSS", 28, &typeid(HingeLossLayer<float>)},
      {"MEMORY_DATA", 29, &typeid(MemoryDataLayer<float>)},
  };
  const google::protobuf::EnumDescriptor* schema = LayerParameter::LayerType_descriptor();
  EXPECT_EQ(schema->value_count(), 30) << "with NONE = 0 and WINDOW_DATA = 24, fatal below";
  EXPECT_EQ(schema->FindValueByName("NONE")->number(), 0);
  EXPECT_EQ(schema->FindValueByName("WINDOW_DATA")->number(), 24);
  for (const auto& t : types) {
    ASSERT_EQ(schema->FindValueByName(t.name)->number(), t.number) << t.name;
    std::unique_ptr<Layer<float>> layer(GetLayer<float>(Param(t.number)));
    ASSERT_EQ(layer != nullptr, t.type != nullptr) << t.name;
    if (layer) {
      EXPECT_EQ(typeid(*layer), *t.type) << t.name;
      EXPECT_EQ(layer->layer_param().name(), "x") << "constructed with the whole parameter";
    }
  }
}

TEST(LayerFactoryDeathTest, NoTypeWindowDataAndUnknownNumbersAreFatal) {
  EXPECT_DEATH(GetLayer<float>(Param(LayerParameter::NONE)), "Layer x has unspecified type.");
  EXPECT_DEATH(GetLayer<float>(Param(LayerParameter::WINDOW_DATA)), "Layer x has unknown type 24");
  EXPECT_DEATH(GetLayer<float>(Param(30)), "Layer x has unknown type 30");
}

}  // namespace
}  // namespace nn
