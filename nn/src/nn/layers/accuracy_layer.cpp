#include <glog/logging.h>

#include <cmath>
#include <limits>

#include "nn/loss_layers.h"
#include "scores_and_labels.h"

namespace nn {

template <typename Dtype>
void AccuracyLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                                 std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 2) << "Accuracy Layer takes two blobs as input.";
  CHECK_EQ(top->size(), 1) << "Accuracy Layer takes 1 output.";
  CHECK_EQ(bottom[0]->num(), bottom[1]->num())
      << "The data and label should have the same number.";
  CheckOneLabelPerImage(bottom);
  (*top)[0]->Reshape(1, 2, 1, 1);
}

template <typename Dtype>
Dtype AccuracyLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                        std::vector<Blob<Dtype>*>* top) {
  const ScoresAndLabels<Dtype> in(*bottom[0], *bottom[1]);
  Dtype accuracy = 0;
  Dtype logprob = 0;
  for (int i = 0; i < in.num; ++i) {
    const Dtype* row = in.scores + i * in.dim;
    // Strictly above: the first of equal scores wins.
    Dtype maxval = -std::numeric_limits<Dtype>::max();
    int max_id = 0;
    for (int j = 0; j < in.dim; ++j) {
      if (row[j] > maxval) {
        maxval = row[j];
        max_id = j;
      }
    }
    if (max_id == in.label(i)) {
      ++accuracy;
    }
    logprob -= std::log(FlooredProbability(in.scores[in.label_index(i)]));
  }
  Dtype* top_data = (*top)[0]->mutable_cpu_data();
  top_data[0] = accuracy / in.num;
  top_data[1] = logprob / in.num;
  return Dtype(0);
}

template <typename Dtype>
void AccuracyLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>&, bool,
                                        std::vector<Blob<Dtype>*>*) {
  LOG(FATAL) << "Not Implemented Yet";
}

template class AccuracyLayer<float>;

}  // namespace nn
