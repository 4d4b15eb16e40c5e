#include <glog/logging.h>

#include <cmath>

#include "nn/loss_layers.h"
#include "nn/util/math_functions.h"

namespace nn {

template <typename Dtype>
SigmoidCrossEntropyLossLayer<Dtype>::SigmoidCrossEntropyLossLayer(const LayerParameter& param)
    : LossLayer<Dtype>(param),
      sigmoid_layer_(new SigmoidLayer<Dtype>(param)),
      sigmoid_output_(new Blob<Dtype>()) {}

template <typename Dtype>
void SigmoidCrossEntropyLossLayer<Dtype>::FurtherSetUp(const std::vector<Blob<Dtype>*>& bottom,
                                                       std::vector<Blob<Dtype>*>*) {
  CHECK_EQ(bottom[0]->count(), bottom[1]->count())
      << "SigmoidCrossEntropyLoss Layer inputs must have same count.";
  sigmoid_bottom_vec_ = {bottom[0]};
  sigmoid_top_vec_ = {sigmoid_output_.get()};
  sigmoid_layer_->SetUp(sigmoid_bottom_vec_, &sigmoid_top_vec_);
}

template <typename Dtype>
Dtype SigmoidCrossEntropyLossLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                                       std::vector<Blob<Dtype>*>*) {
  sigmoid_layer_->Forward(sigmoid_bottom_vec_, &sigmoid_top_vec_);
  const Dtype* input = bottom[0]->cpu_data();
  const Dtype* target = bottom[1]->cpu_data();
  const int count = bottom[0]->count();
  Dtype loss = 0;
  for (int i = 0; i < count; ++i) {
    // exp of a non-positive number only, so large |x| stays finite.
    const Dtype x = input[i];
    const Dtype b = x >= 0 ? Dtype(1) : Dtype(0);
    loss -= x * (target[i] - b) - std::log(1 + std::exp(x - 2 * x * b));
  }
  return loss / bottom[0]->num();
}

template <typename Dtype>
void SigmoidCrossEntropyLossLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>&,
                                                       bool propagate_down,
                                                       std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  Blob<Dtype>* input = (*bottom)[0];
  Dtype* diff = input->mutable_cpu_diff();
  vsSub(input->count(), sigmoid_output_->cpu_data(), (*bottom)[1]->cpu_data(), diff);
  cblas_sscal(input->count(), Dtype(1) / input->num(), diff, 1);
}

template class SigmoidCrossEntropyLossLayer<float>;

}  // namespace nn
