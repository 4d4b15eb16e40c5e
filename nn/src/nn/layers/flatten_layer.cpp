#include <glog/logging.h>

#include "nn/common_layers.h"

namespace nn {

template <typename Dtype>
void FlattenLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                                std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 1) << "Flatten Layer takes a single blob as input.";
  CHECK_EQ(top->size(), 1) << "Flatten Layer takes a single blob as output.";
  const int channels_out = bottom[0]->channels() * bottom[0]->height() * bottom[0]->width();
  (*top)[0]->Reshape(bottom[0]->num(), channels_out, 1, 1);
  count_ = bottom[0]->num() * channels_out;
  CHECK_EQ(count_, bottom[0]->count());
  CHECK_EQ(count_, (*top)[0]->count());
}

template <typename Dtype>
Dtype FlattenLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                       std::vector<Blob<Dtype>*>* top) {
  (*top)[0]->ShareData(*bottom[0]);
  return Dtype(0);
}

template <typename Dtype>
void FlattenLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                       std::vector<Blob<Dtype>*>* bottom) {
  if (propagate_down) {
    (*bottom)[0]->ShareDiff(*top[0]);
  }
}

template class FlattenLayer<float>;

}  // namespace nn
