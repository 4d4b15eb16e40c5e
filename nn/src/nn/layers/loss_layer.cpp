#include <glog/logging.h>

#include <algorithm>
#include <cmath>

#include "nn/loss_layers.h"
#include "nn/util/io.h"
#include "nn/util/math_functions.h"
#include "scores_and_labels.h"

namespace nn {

template <typename Dtype>
void LossLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                             std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 2) << "Loss Layer takes two blobs as input.";
  CHECK_EQ(top->size(), 0) << "Loss Layer takes no output.";
  CHECK_EQ(bottom[0]->num(), bottom[1]->num())
      << "The data and label should have the same number.";
  FurtherSetUp(bottom, top);
}

template <typename Dtype>
void EuclideanLossLayer<Dtype>::FurtherSetUp(const std::vector<Blob<Dtype>*>& bottom,
                                             std::vector<Blob<Dtype>*>*) {
  CHECK_EQ(bottom[0]->channels(), bottom[1]->channels());
  CHECK_EQ(bottom[0]->height(), bottom[1]->height());
  CHECK_EQ(bottom[0]->width(), bottom[1]->width());
  difference_.Reshape(bottom[0]->num(), bottom[0]->channels(), bottom[0]->height(),
                      bottom[0]->width());
}

template <typename Dtype>
Dtype EuclideanLossLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                             std::vector<Blob<Dtype>*>*) {
  const int count = bottom[0]->count();
  Dtype* difference = difference_.mutable_cpu_data();
  vsSub(count, bottom[0]->cpu_data(), bottom[1]->cpu_data(), difference);
  const Dtype dot = cblas_sdot(count, difference, 1, difference, 1);
  return dot / bottom[0]->num() * Dtype(0.5);
}

template <typename Dtype>
void EuclideanLossLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>&,
                                             bool propagate_down,
                                             std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  Blob<Dtype>* predicted = (*bottom)[0];
  cblas_saxpby(predicted->count(), Dtype(1) / predicted->num(), difference_.cpu_data(), 1,
               Dtype(0), predicted->mutable_cpu_diff(), 1);
}

template <typename Dtype>
Dtype HingeLossLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                         std::vector<Blob<Dtype>*>*) {
  const ScoresAndLabels<Dtype> in(*bottom[0], *bottom[1]);
  Dtype* margin = bottom[0]->mutable_cpu_diff();
  cblas_scopy(in.count, in.scores, 1, margin, 1);
  for (int i = 0; i < in.num; ++i) {
    margin[in.label_index(i)] *= -1;
  }
  for (int i = 0; i < in.count; ++i) {
    margin[i] = std::max(Dtype(0), Dtype(1) + margin[i]);
  }
  return cblas_sasum(in.count, margin, 1) / in.num;
}

template <typename Dtype>
void HingeLossLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>&, bool propagate_down,
                                         std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  const ScoresAndLabels<Dtype> in(*(*bottom)[0], *(*bottom)[1]);
  // Starts from the margins that the forward pass left here.
  Dtype* diff = (*bottom)[0]->mutable_cpu_diff();
  nn_cpu_sign(in.count, diff, diff);
  for (int i = 0; i < in.num; ++i) {
    diff[in.label_index(i)] *= -1;
  }
  cblas_sscal(in.count, Dtype(1) / in.num, diff, 1);
}

template <typename Dtype>
void MultinomialLogisticLossLayer<Dtype>::FurtherSetUp(const std::vector<Blob<Dtype>*>& bottom,
                                                       std::vector<Blob<Dtype>*>*) {
  CheckOneLabelPerImage(bottom);
}

template <typename Dtype>
Dtype MultinomialLogisticLossLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                                       std::vector<Blob<Dtype>*>*) {
  const ScoresAndLabels<Dtype> in(*bottom[0], *bottom[1]);
  Dtype loss = 0;
  for (int i = 0; i < in.num; ++i) {
    loss -= std::log(FlooredProbability(in.scores[in.label_index(i)]));
  }
  return loss / in.num;
}

template <typename Dtype>
void MultinomialLogisticLossLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>&,
                                                       bool propagate_down,
                                                       std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  const ScoresAndLabels<Dtype> in(*(*bottom)[0], *(*bottom)[1]);
  Dtype* diff = (*bottom)[0]->mutable_cpu_diff();
  std::fill(diff, diff + in.count, Dtype(0));
  const Dtype scale = -Dtype(1) / in.num;
  for (int i = 0; i < in.num; ++i) {
    diff[in.label_index(i)] = scale / FlooredProbability(in.scores[in.label_index(i)]);
  }
}

template <typename Dtype>
void InfogainLossLayer<Dtype>::FurtherSetUp(const std::vector<Blob<Dtype>*>& bottom,
                                            std::vector<Blob<Dtype>*>*) {
  CheckOneLabelPerImage(bottom);
  BlobProto blob_proto;
  ReadProtoFromBinaryFileOrDie(this->layer_param_.infogain_loss_param().source().c_str(),
                               &blob_proto);
  infogain_.FromProto(blob_proto);
  const int dim = bottom[0]->count() / bottom[0]->num();
  CHECK_EQ(infogain_.num(), 1);
  CHECK_EQ(infogain_.channels(), 1);
  CHECK_EQ(infogain_.height(), infogain_.width());
  CHECK_EQ(infogain_.height(), dim);
}

template <typename Dtype>
Dtype InfogainLossLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                            std::vector<Blob<Dtype>*>*) {
  const ScoresAndLabels<Dtype> in(*bottom[0], *bottom[1]);
  Dtype loss = 0;
  for (int i = 0; i < in.num; ++i) {
    const Dtype* gains = infogain_.cpu_data() + in.label(i) * in.dim;
    for (int j = 0; j < in.dim; ++j) {
      loss -= gains[j] * std::log(FlooredProbability(in.scores[i * in.dim + j]));
    }
  }
  return loss / in.num;
}

template <typename Dtype>
void InfogainLossLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>&,
                                            bool propagate_down,
                                            std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  const ScoresAndLabels<Dtype> in(*(*bottom)[0], *(*bottom)[1]);
  Dtype* diff = (*bottom)[0]->mutable_cpu_diff();
  for (int i = 0; i < in.num; ++i) {
    const Dtype* gains = infogain_.cpu_data() + in.label(i) * in.dim;
    for (int j = 0; j < in.dim; ++j) {
      const int index = i * in.dim + j;
      diff[index] = -gains[j] / FlooredProbability(in.scores[index]) / in.num;
    }
  }
}

template class LossLayer<float>;
template class EuclideanLossLayer<float>;
template class HingeLossLayer<float>;
template class MultinomialLogisticLossLayer<float>;
template class InfogainLossLayer<float>;

}  // namespace nn
