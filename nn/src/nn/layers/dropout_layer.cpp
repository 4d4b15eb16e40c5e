#include <glog/logging.h>

#include "nn/engine.h"
#include "nn/neuron_layers.h"
#include "nn/util/math_functions.h"

namespace nn {

template <typename Dtype>
void DropoutLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                                std::vector<Blob<Dtype>*>* top) {
  NeuronLayer<Dtype>::SetUp(bottom, top);
  rand_vec_.reset(new SyncedMemory(bottom[0]->count() * sizeof(int)));
  threshold_ = this->layer_param_.dropout_param().dropout_ratio();
  scale_ = Dtype(1) / (Dtype(1) - threshold_);
  uint_thres_ = static_cast<unsigned int>(threshold_ * 4294967296.0f);
}

template <typename Dtype>
Dtype DropoutLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                       std::vector<Blob<Dtype>*>* top) {
  const Dtype* bottom_data = bottom[0]->cpu_data();
  Dtype* top_data = (*top)[0]->mutable_cpu_data();
  const int count = bottom[0]->count();
  if (Engine::phase() == Engine::TRAIN) {
    int* mask = static_cast<int*>(rand_vec_->mutable_cpu_data());
    nn_rng_bernoulli(count, 1. - threshold_, mask);
    for (int i = 0; i < count; ++i) {
      top_data[i] = bottom_data[i] * mask[i] * scale_;
    }
  } else {
    cblas_scopy(count, bottom_data, 1, top_data, 1);
  }
  return Dtype(0);
}

template <typename Dtype>
void DropoutLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                       std::vector<Blob<Dtype>*>* bottom) {
  CHECK(Engine::phase() == Engine::TRAIN);
  if (!propagate_down) {
    return;
  }
  const Dtype* top_diff = top[0]->cpu_diff();
  Dtype* bottom_diff = (*bottom)[0]->mutable_cpu_diff();
  const int* mask = static_cast<const int*>(rand_vec_->cpu_data());
  const int count = (*bottom)[0]->count();
  for (int i = 0; i < count; ++i) {
    bottom_diff[i] = top_diff[i] * mask[i] * scale_;
  }
}

template class DropoutLayer<float>;

}  // namespace nn
