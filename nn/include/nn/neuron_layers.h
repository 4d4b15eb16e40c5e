#ifndef NN_NEURON_LAYERS_H_
#define NN_NEURON_LAYERS_H_

#include <boost/shared_ptr.hpp>

#include <vector>

#include "nn/blob.h"
#include "nn/layer.h"
#include "nn/syncedmem.h"

namespace nn {

// Element-wise layers from one bottom to one top of the same shape; all of
// them may work in place. They keep the base's empty AlterInputShape, which
// is right when they work in place.
template <typename Dtype>
class NeuronLayer : public Layer<Dtype> {
 public:
  explicit NeuronLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;
};

#define NN_DECLARE_NEURON_LAYER(Name)                                                   \
  template <typename Dtype>                                                             \
  class Name : public NeuronLayer<Dtype> {                                              \
   public:                                                                              \
    explicit Name(const LayerParameter& param) : NeuronLayer<Dtype>(param) {}           \
                                                                                        \
   protected:                                                                           \
    Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,                          \
                      std::vector<Blob<Dtype>*>* top) override;                         \
    void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,        \
                      std::vector<Blob<Dtype>*>* bottom) override;                      \
  }

// max(x, 0).
NN_DECLARE_NEURON_LAYER(ReLULayer);
// 1 / (1 + exp(-x)).
NN_DECLARE_NEURON_LAYER(SigmoidLayer);
// (exp(2x) - 1) / (exp(2x) + 1), with no guard against overflow.
NN_DECLARE_NEURON_LAYER(TanHLayer);
// log(1 + exp(x)), written to stay finite for large x.
NN_DECLARE_NEURON_LAYER(BNLLLayer);

#undef NN_DECLARE_NEURON_LAYER

// (shift + scale * x) ^ power.
template <typename Dtype>
class PowerLayer : public NeuronLayer<Dtype> {
 public:
  explicit PowerLayer(const LayerParameter& param) : NeuronLayer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;

 private:
  Dtype power_ = 0;
  Dtype scale_ = 0;
  Dtype shift_ = 0;
  Dtype diff_scale_ = 0;
};

// In training, zeroes each element with probability dropout_ratio and scales
// the rest up; in testing, a copy.
template <typename Dtype>
class DropoutLayer : public NeuronLayer<Dtype> {
 public:
  explicit DropoutLayer(const LayerParameter& param) : NeuronLayer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;

 private:
  boost::shared_ptr<SyncedMemory> rand_vec_;
  Dtype threshold_ = 0;
  Dtype scale_ = 0;
  unsigned int uint_thres_ = 0;
};

}  // namespace nn

#endif  // NN_NEURON_LAYERS_H_
