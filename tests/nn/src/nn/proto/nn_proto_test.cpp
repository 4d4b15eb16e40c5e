#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "gradient_checker.h"
#include "nn/data_layers.h"
#include "nn/proto/nn.pb.h"

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

// The numbers are those stored in weight files. Each type but NONE and
// WINDOW_DATA gets a layer made with the whole parameter, but the HDF5 ones;
// layer tests build their layers through the factory, which checks the classes.
TEST(LayerFactoryDeathTest, TypeNumbersAreThoseOfTheWeightFilesAndGiveTheirLayers) {
  const google::protobuf::EnumDescriptor* types = LayerParameter::LayerType_descriptor();
  std::string names;
  for (int number = 0; number < types->value_count(); ++number) {
    names += types->FindValueByNumber(number)->name() + " ";
  }
  EXPECT_EQ(names,
            "NONE ACCURACY BNLL CONCAT CONVOLUTION DATA DROPOUT EUCLIDEAN_LOSS FLATTEN HDF5_DATA "
            "HDF5_OUTPUT IM2COL IMAGE_DATA INFOGAIN_LOSS INNER_PRODUCT LRN "
            "MULTINOMIAL_LOGISTIC_LOSS POOLING RELU SIGMOID SOFTMAX SOFTMAX_LOSS SPLIT TANH "
            "WINDOW_DATA ELTWISE_PRODUCT POWER SIGMOID_CROSS_ENTROPY_LOSS HINGE_LOSS MEMORY_DATA ");
  const auto make = [](int number) {
    return std::unique_ptr<Layer<float>>(number == 24 ? nullptr : GetLayer<float>(Param(number)));
  };
  for (int number = 1; number < 30; ++number) {
    const bool none = number == 9 || number == 10 || number == 24;
    EXPECT_EQ(make(number) ? make(number)->layer_param().name() : "", none ? "" : "x") << number;
  }
  EXPECT_TRUE(dynamic_cast<DataLayer<float>*>(make(5).get()));
  EXPECT_TRUE(dynamic_cast<ImageDataLayer<float>*>(make(12).get()));
  EXPECT_TRUE(dynamic_cast<MemoryDataLayer<float>*>(make(29).get()));
  EXPECT_DEATH(GetLayer<float>(Param(LayerParameter::NONE)), "Layer x has unspecified type.");
  EXPECT_DEATH(GetLayer<float>(Param(LayerParameter::WINDOW_DATA)), "Layer x has unknown type 24");
  EXPECT_DEATH(GetLayer<float>(Param(30)), "Layer x has unknown type 30");
}

}  // namespace
}  // namespace nn
