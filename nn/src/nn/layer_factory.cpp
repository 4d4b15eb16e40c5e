#include <glog/logging.h>

#include "nn/common_layers.h"
#include "nn/layer.h"
#include "nn/neuron_layers.h"
#include "nn/vision_layers.h"

namespace nn {

template <typename Dtype>
Layer<Dtype>* GetLayer(const LayerParameter& param) {
  const std::string& name = param.name();
  const LayerParameter::LayerType type = param.type();
  switch (type) {
    case LayerParameter::BNLL:
      return new BNLLLayer<Dtype>(param);
    case LayerParameter::CONCAT:
      return new ConcatLayer<Dtype>(param);
    case LayerParameter::CONVOLUTION:
      return new ConvolutionLayer<Dtype>(param);
    case LayerParameter::DROPOUT:
      return new DropoutLayer<Dtype>(param);
    case LayerParameter::ELTWISE_PRODUCT:
      return new EltwiseProductLayer<Dtype>(param);
    case LayerParameter::FLATTEN:
      return new FlattenLayer<Dtype>(param);
    case LayerParameter::HDF5_DATA:
    case LayerParameter::HDF5_OUTPUT:
      return nullptr;
    case LayerParameter::IM2COL:
      return new Im2colLayer<Dtype>(param);
    case LayerParameter::INNER_PRODUCT:
      return new InnerProductLayer<Dtype>(param);
    case LayerParameter::LRN:
      return new LRNLayer<Dtype>(param);
    case LayerParameter::POOLING:
      return new PoolingLayer<Dtype>(param);
    case LayerParameter::POWER:
      return new PowerLayer<Dtype>(param);
    case LayerParameter::RELU:
      return new ReLULayer<Dtype>(param);
    case LayerParameter::SIGMOID:
      return new SigmoidLayer<Dtype>(param);
    case LayerParameter::SOFTMAX:
      return new SoftmaxLayer<Dtype>(param);
    case LayerParameter::SPLIT:
      return new SplitLayer<Dtype>(param);
    case LayerParameter::TANH:
      return new TanHLayer<Dtype>(param);
    case LayerParameter::ACCURACY:
    case LayerParameter::DATA:
    case LayerParameter::EUCLIDEAN_LOSS:
    case LayerParameter::HINGE_LOSS:
    case LayerParameter::IMAGE_DATA:
    case LayerParameter::INFOGAIN_LOSS:
    case LayerParameter::MEMORY_DATA:
    case LayerParameter::MULTINOMIAL_LOGISTIC_LOSS:
    case LayerParameter::SIGMOID_CROSS_ENTROPY_LOSS:
    case LayerParameter::SOFTMAX_LOSS:
      LOG(FATAL) << "Layer " << name << " has type " << LayerParameter::LayerType_Name(type)
                 << ", which this build cannot run yet.";
      break;
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
