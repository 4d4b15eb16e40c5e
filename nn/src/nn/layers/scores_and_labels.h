#ifndef NN_LAYERS_SCORES_AND_LABELS_H_
#define NN_LAYERS_SCORES_AND_LABELS_H_

#include <glog/logging.h>

#include <algorithm>
#include <vector>

#include "nn/blob.h"
#include "nn/loss_layers.h"

namespace nn {

// The two bottoms of a loss or accuracy layer as flat arrays: num rows of dim
// scores, and one label a row.
template <typename Dtype>
struct ScoresAndLabels {
  ScoresAndLabels(const Blob<Dtype>& score_blob, const Blob<Dtype>& label_blob)
      : scores(score_blob.cpu_data()),
        labels(label_blob.cpu_data()),
        num(score_blob.num()),
        count(score_blob.count()),
        dim(count / num) {}

  // Labels are floats, truncated toward zero; nothing checks them against dim.
  int label(int i) const { return static_cast<int>(labels[i]); }
  // Where row i's label points in the scores.
  int label_index(int i) const { return i * dim + label(i); }

  const Dtype* scores;
  const Dtype* labels;
  int num;
  int count;
  int dim;
};

// The second bottom must hold one value an image.
template <typename Dtype>
void CheckOneLabelPerImage(const std::vector<Blob<Dtype>*>& bottom) {
  CHECK_EQ(bottom[1]->channels(), 1);
  CHECK_EQ(bottom[1]->height(), 1);
  CHECK_EQ(bottom[1]->width(), 1);
}

template <typename Dtype>
Dtype FlooredProbability(Dtype p) {
  return std::max(p, Dtype(kLOG_THRESHOLD));
}

}  // namespace nn

#endif  // NN_LAYERS_SCORES_AND_LABELS_H_
