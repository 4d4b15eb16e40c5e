#include <glog/logging.h>

#include "nn/common_layers.h"
#include "nn/util/math_functions.h"

namespace nn {

template <typename Dtype>
void EltwiseProductLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                                       std::vector<Blob<Dtype>*>* top) {
  CHECK_GE(bottom.size(), 2) << "Eltwise Product Layer takes at least 2 blobs as input.";
  CHECK_EQ(top->size(), 1) << "Eltwise Product Layer takes a single blob as output.";
  const int num = bottom[0]->num();
  const int channels = bottom[0]->channels();
  const int height = bottom[0]->height();
  const int width = bottom[0]->width();
  for (size_t i = 1; i < bottom.size(); ++i) {
    CHECK_EQ(num, bottom[i]->num());
    CHECK_EQ(channels, bottom[i]->channels());
    CHECK_EQ(height, bottom[i]->height());
    CHECK_EQ(width, bottom[i]->width());
  }
  (*top)[0]->Reshape(num, channels, height, width);
}

template <typename Dtype>
Dtype EltwiseProductLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                              std::vector<Blob<Dtype>*>* top) {
  const int count = (*top)[0]->count();
  Dtype* top_data = (*top)[0]->mutable_cpu_data();
  vsMul(count, bottom[0]->cpu_data(), bottom[1]->cpu_data(), top_data);
  for (size_t i = 2; i < bottom.size(); ++i) {
    vsMul(count, top_data, bottom[i]->cpu_data(), top_data);
  }
  return Dtype(0);
}

// Dividing the product by one factor gives the product of the others; where a
// factor is exactly zero this yields no finite gradient.
template <typename Dtype>
void EltwiseProductLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top,
                                              bool propagate_down,
                                              std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  const int count = top[0]->count();
  const Dtype* top_data = top[0]->cpu_data();
  const Dtype* top_diff = top[0]->cpu_diff();
  for (Blob<Dtype>* in : *bottom) {
    Dtype* bottom_diff = in->mutable_cpu_diff();
    vsDiv(count, top_data, in->cpu_data(), bottom_diff);
    vsMul(count, bottom_diff, top_diff, bottom_diff);
  }
}

template class EltwiseProductLayer<float>;

}  // namespace nn
