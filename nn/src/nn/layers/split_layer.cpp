#include <glog/logging.h>

#include "nn/common_layers.h"
#include "nn/util/math_functions.h"

namespace nn {

template <typename Dtype>
void SplitLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                              std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 1) << "Split Layer takes a single blob as input.";
  CHECK_GE(top->size(), 1) << "Split Layer takes at least one blob as output.";
  count_ = bottom[0]->count();
  for (size_t i = 0; i < top->size(); ++i) {
    // Top 0 may be the bottom itself: the first consumer works in place.
    if (i == 0 && (*top)[i] == bottom[0]) {
      continue;
    }
    CHECK_NE((*top)[i], bottom[0]) << "Only 0th top blob may be in place.";
    (*top)[i]->Reshape(bottom[0]->num(), bottom[0]->channels(), bottom[0]->height(),
                       bottom[0]->width());
    CHECK_EQ(count_, (*top)[i]->count());
  }
}

template <typename Dtype>
Dtype SplitLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                     std::vector<Blob<Dtype>*>* top) {
  for (Blob<Dtype>* out : *top) {
    out->ShareData(*bottom[0]);
  }
  return Dtype(0);
}

template <typename Dtype>
void SplitLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                     std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  (*bottom)[0]->ShareDiff(*top[0]);
  Dtype* bottom_diff = (*bottom)[0]->mutable_cpu_diff();
  for (size_t i = 1; i < top.size(); ++i) {
    cblas_saxpy(count_, 1.0f, top[i]->cpu_diff(), 1, bottom_diff, 1);
  }
}

template class SplitLayer<float>;

}  // namespace nn
