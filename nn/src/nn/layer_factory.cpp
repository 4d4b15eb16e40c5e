#include <glog/logging.h>

#include "nn/common_layers.h"
#include "nn/data_layers.h"
#include "nn/layer.h"
#include "nn/loss_layers.h"
#include "nn/neuron_layers.h"
#include "nn/vision_layers.h"

namespace nn {

template <typename Dtype>
Layer<Dtype>* GetLayer(const LayerParameter& param) {
  const std::string& name = param.name();
  const LayerParameter::LayerType type = param.type();
  switch (type) {
    case LayerParameter::ACCURACY:
      return new AccuracyLayer<Dtype>(param);
    case LayerParameter::BNLL:
      return new BNLLLayer<Dtype>(param);
    case LayerParameter::CONCAT:
      return new ConcatLayer<Dtype>(param);
    case LayerParameter::CONVOLUTION:
      return new ConvolutionLayer<Dtype>(param);
    case LayerParameter::DATA:
      return new DataLayer<Dtype>(param);
    case LayerParameter::DROPOUT:
      return new DropoutLayer<Dtype>(param);
    case LayerParameter::ELTWISE_PRODUCT:
      return new EltwiseProductLayer<Dtype>(param);
    case LayerParameter::EUCLIDEAN_LOSS:
      return new EuclideanLossLayer<Dtype>(param);
    case LayerParameter::FLATTEN:
      return new FlattenLayer<Dtype>(param);
    case LayerParameter::HDF5_DATA:
    case LayerParameter::HDF5_OUTPUT:
      return nullptr;
    case LayerParameter::HINGE_LOSS:
      return new HingeLossLayer<Dtype>(param);
    case LayerParameter::IM2COL:
      return new Im2colLayer<Dtype>(param);
    case LayerParameter::IMAGE_DATA:
      return new ImageDataLayer<Dtype>(param);
    case LayerParameter::INFOGAIN_LOSS:
      return new InfogainLossLayer<Dtype>(param);
    case LayerParameter::INNER_PRODUCT:
      return new InnerProductLayer<Dtype>(param);
    case LayerParameter::LRN:
      return new LRNLayer<Dtype>(param);
    case LayerParameter::MEMORY_DATA:
      return new MemoryDataLayer<Dtype>(param);
    case LayerParameter::MULTINOMIAL_LOGISTIC_LOSS:
      return new MultinomialLogisticLossLayer<Dtype>(param);
    case LayerParameter::POOLING:
      return new PoolingLayer<Dtype>(param);
    case LayerParameter::POWER:
      return new PowerLayer<Dtype>(param);
    case LayerParameter::RELU:
      return new ReLULayer<Dtype>(param);
    case LayerParameter::SIGMOID:
      return new SigmoidLayer<Dtype>(param);
    case LayerParameter::SIGMOID_CROSS_ENTROPY_LOSS:
      return new SigmoidCrossEntropyLossLayer<Dtype>(param);
    case LayerParameter::SOFTMAX:
      return new SoftmaxLayer<Dtype>(param);
    case LayerParameter::SOFTMAX_LOSS:
      return new SoftmaxWithLossLayer<Dtype>(param);
    case LayerParameter::SPLIT:
      return new SplitLayer<Dtype>(param);
    case LayerParameter::TANH:
      return new TanHLayer<Dtype>(param);
    case LayerParameter::NONE:
      LOG(FATAL) << "Layer " << name << " has unspecified type.";
      break;
    default:
      // WINDOW_DATA has no class and lands here with any other number.
      LOG(FATAL) << "Layer " << name << " has unknown type " << type;
  }
  return nullptr;
}

template Layer<float>* GetLayer<float>(const LayerParameter& param);

}  // namespace nn
