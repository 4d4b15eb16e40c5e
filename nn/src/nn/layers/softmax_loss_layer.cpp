#include <glog/logging.h>

#include <algorithm>
#include <cmath>
#include <limits>

#include "nn/loss_layers.h"
#include "nn/util/math_functions.h"
#include "scores_and_labels.h"

namespace nn {

template <typename Dtype>
SoftmaxWithLossLayer<Dtype>::SoftmaxWithLossLayer(const LayerParameter& param)
    : Layer<Dtype>(param), softmax_layer_(new SoftmaxLayer<Dtype>(param)) {}

template <typename Dtype>
void SoftmaxWithLossLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                                        std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 2) << "SoftmaxLoss Layer takes two blobs as input.";
  CHECK_EQ(top->size(), 0) << "SoftmaxLoss Layer takes no blob as output.";
  softmax_bottom_vec_ = {bottom[0]};
  softmax_top_vec_ = {&prob_};
  softmax_layer_->SetUp(softmax_bottom_vec_, &softmax_top_vec_);
}

template <typename Dtype>
Dtype SoftmaxWithLossLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                               std::vector<Blob<Dtype>*>*) {
  softmax_layer_->Forward(softmax_bottom_vec_, &softmax_top_vec_);
  const ScoresAndLabels<Dtype> in(prob_, *bottom[1]);
  // A lower floor than the other losses': the smallest normal float.
  const Dtype floor = std::numeric_limits<Dtype>::min();
  Dtype loss = 0;
  for (int i = 0; i < in.num; ++i) {
    loss -= std::log(std::max(in.scores[in.label_index(i)], floor));
  }
  return loss / in.num;
}

template <typename Dtype>
void SoftmaxWithLossLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>&,
                                               bool propagate_down,
                                               std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  const ScoresAndLabels<Dtype> in(prob_, *(*bottom)[1]);
  Dtype* diff = (*bottom)[0]->mutable_cpu_diff();
  cblas_scopy(in.count, in.scores, 1, diff, 1);
  for (int i = 0; i < in.num; ++i) {
    diff[in.label_index(i)] -= 1;
  }
  cblas_sscal(in.count, Dtype(1) / in.num, diff, 1);
}

template class SoftmaxWithLossLayer<float>;

}  // namespace nn
