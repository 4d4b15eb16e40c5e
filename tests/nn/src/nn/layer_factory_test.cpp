#include <gtest/gtest.h>

#include <memory>
#include <typeinfo>

#include "nn/common_layers.h"
#include "nn/data_layers.h"
#include "nn/layer.h"
#include "nn/loss_layers.h"
#include "nn/neuron_layers.h"
#include "nn/vision_layers.h"

namespace nn {
namespace {

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
