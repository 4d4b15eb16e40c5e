#include <algorithm>
#include <cmath>

#include "nn/neuron_layers.h"
#include "nn/util/math_functions.h"

namespace nn {

template <typename Dtype>
void PowerLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                              std::vector<Blob<Dtype>*>* top) {
  NeuronLayer<Dtype>::SetUp(bottom, top);
  const PowerParameter& param = this->layer_param_.power_param();
  power_ = param.power();
  scale_ = param.scale();
  shift_ = param.shift();
  diff_scale_ = power_ * scale_;
}

template <typename Dtype>
Dtype PowerLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                     std::vector<Blob<Dtype>*>* top) {
  Dtype* top_data = (*top)[0]->mutable_cpu_data();
  const int count = bottom[0]->count();
  if (diff_scale_ == Dtype(0)) {
    const Dtype value = power_ == Dtype(0) ? Dtype(1) : std::pow(shift_, power_);
    std::fill(top_data, top_data + count, value);
    return Dtype(0);
  }
  // Each step is skipped where it is neutral.
  cblas_scopy(count, bottom[0]->cpu_data(), 1, top_data, 1);
  if (scale_ != Dtype(1)) {
    cblas_sscal(count, scale_, top_data, 1);
  }
  if (shift_ != Dtype(0)) {
    nn_add_scalar(count, shift_, top_data);
  }
  if (power_ != Dtype(1)) {
    vsPowx(count, top_data, power_, top_data);
  }
  return Dtype(0);
}

template <typename Dtype>
void PowerLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                     std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  Dtype* bottom_diff = (*bottom)[0]->mutable_cpu_diff();
  const int count = (*bottom)[0]->count();
  const Dtype* top_diff = top[0]->cpu_diff();
  if (diff_scale_ == Dtype(0) || power_ == Dtype(1)) {
    std::fill(bottom_diff, bottom_diff + count, diff_scale_);
  } else {
    const Dtype* bottom_data = (*bottom)[0]->cpu_data();
    if (power_ == Dtype(2)) {
      // diff_scale * (shift + scale * x), without a power.
      cblas_scopy(count, bottom_data, 1, bottom_diff, 1);
      cblas_sscal(count, diff_scale_ * scale_, bottom_diff, 1);
      if (shift_ != Dtype(0)) {
        nn_add_scalar(count, diff_scale_ * shift_, bottom_diff);
      }
    } else if (shift_ == Dtype(0)) {
      // power * y / x.
      const Dtype* top_data = top[0]->cpu_data();
      vsDiv(count, top_data, bottom_data, bottom_diff);
      cblas_sscal(count, power_, bottom_diff, 1);
    } else {
      // diff_scale * y / (shift + scale * x).
      cblas_scopy(count, bottom_data, 1, bottom_diff, 1);
      if (scale_ != Dtype(1)) {
        cblas_sscal(count, scale_, bottom_diff, 1);
      }
      nn_add_scalar(count, shift_, bottom_diff);
      const Dtype* top_data = top[0]->cpu_data();
      vsDiv(count, top_data, bottom_diff, bottom_diff);
      if (diff_scale_ != Dtype(1)) {
        cblas_sscal(count, diff_scale_, bottom_diff, 1);
      }
    }
  }
  vsMul(count, top_diff, bottom_diff, bottom_diff);
}

template class PowerLayer<float>;

}  // namespace nn
