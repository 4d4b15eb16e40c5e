#include <gtest/gtest.h>

#include <functional>
#include <map>
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

TEST(LayerFactoryTest, EveryTypeOfTheSchemaGetsItsClass) {
  using P = LayerParameter;
  const std::map<int, const std::type_info*> classes = {
      {P::ACCURACY, &typeid(AccuracyLayer<float>)}, {P::BNLL, &typeid(BNLLLayer<float>)},
      {P::CONCAT, &typeid(ConcatLayer<float>)}, {P::CONVOLUTION, &typeid(ConvolutionLayer<float>)},
      {P::DATA, &typeid(DataLayer<float>)}, {P::DROPOUT, &typeid(DropoutLayer<float>)},
      {P::EUCLIDEAN_LOSS, &typeid(EuclideanLossLayer<float>)},
      {P::FLATTEN, &typeid(FlattenLayer<float>)}, {P::IM2COL, &typeid(Im2colLayer<float>)},
      {P::IMAGE_DATA, &typeid(ImageDataLayer<float>)},
      {P::INFOGAIN_LOSS, &typeid(InfogainLossLayer<float>)},
      {P::INNER_PRODUCT, &typeid(InnerProductLayer<float>)}, {P::LRN, &typeid(LRNLayer<float>)},
      {P::MULTINOMIAL_LOGISTIC_LOSS, &typeid(MultinomialLogisticLossLayer<float>)},
      {P::POOLING, &typeid(PoolingLayer<float>)}, {P::RELU, &typeid(ReLULayer<float>)},
      {P::SIGMOID, &typeid(SigmoidLayer<float>)}, {P::SOFTMAX, &typeid(SoftmaxLayer<float>)},
      {P::SOFTMAX_LOSS, &typeid(SoftmaxWithLossLayer<float>)},
      {P::SPLIT, &typeid(SplitLayer<float>)}, {P::TANH, &typeid(TanHLayer<float>)},
      {P::ELTWISE_PRODUCT, &typeid(EltwiseProductLayer<float>)},
      {P::POWER, &typeid(PowerLayer<float>)}, {P::HINGE_LOSS, &typeid(HingeLossLayer<float>)},
      {P::SIGMOID_CROSS_ENTROPY_LOSS, &typeid(SigmoidCrossEntropyLossLayer<float>)},
      {P::MEMORY_DATA, &typeid(MemoryDataLayer<float>)},
  };
  const google::protobuf::EnumDescriptor* types = LayerParameter::LayerType_descriptor();
  for (int i = 0; i < types->value_count(); ++i) {
    const int type = types->value(i)->number();
    if (type == P::NONE || type == P::WINDOW_DATA) {
      continue;  // fatal, below
    }
    std::unique_ptr<Layer<float>> layer(GetLayer<float>(Param(type)));
    if (type == P::HDF5_DATA || type == P::HDF5_OUTPUT) {
      EXPECT_FALSE(layer) << types->value(i)->name();
      continue;
    }
    ASSERT_TRUE(classes.count(type)) << "no expectation for " << types->value(i)->name();
    ASSERT_TRUE(layer) << types->value(i)->name();
    EXPECT_EQ(typeid(*layer), *classes.at(type)) << types->value(i)->name();
    EXPECT_EQ(layer->layer_param().name(), "x") << "constructed with the whole parameter";
  }
}

TEST(LayerFactoryDeathTest, NoTypeWindowDataAndUnknownNumbersAreFatal) {
  EXPECT_DEATH(GetLayer<float>(Param(LayerParameter::NONE)), "Layer x has unspecified type.");
  EXPECT_DEATH(GetLayer<float>(Param(LayerParameter::WINDOW_DATA)), "Layer x has unknown type 24");
  EXPECT_DEATH(GetLayer<float>(Param(30)), "Layer x has unknown type 30");
}

}  // namespace
}  // namespace nn
