#ifndef NN_LOSS_LAYERS_H_
#define NN_LOSS_LAYERS_H_

#include <boost/shared_ptr.hpp>

#include <vector>

#include "nn/blob.h"
#include "nn/common_layers.h"
#include "nn/layer.h"
#include "nn/neuron_layers.h"

namespace nn {

// The layers that measure a net's output (first bottom, p) against labels or
// targets (second bottom, t), and the accuracy score. A loss layer's forward
// pass returns the loss, averaged over the num of the batch, and writes no
// top; its backward pass writes the loss's gradient into the first bottom.
// Labels are floats truncated toward zero; nothing checks that they index
// inside an image's row.
//
// Not thread-safe: a layer belongs to one net, and a net to one thread.

// The floor under probabilities before their logarithm is taken; the softmax
// loss uses a lower one, the smallest normal float.
constexpr float kLOG_THRESHOLD = 1e-20f;

// Two bottoms of one num, no top; subclasses check the rest in FurtherSetUp.
template <typename Dtype>
class LossLayer : public Layer<Dtype> {
 public:
  explicit LossLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;
  virtual void FurtherSetUp(const std::vector<Blob<Dtype>*>&, std::vector<Blob<Dtype>*>*) {}
};

#define NN_DECLARE_LOSS_LAYER_FORWARD_BACKWARD                                         \
 protected:                                                                            \
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,                           \
                    std::vector<Blob<Dtype>*>* top) override;                          \
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,         \
                    std::vector<Blob<Dtype>*>* bottom) override

// Half the squared distance between p and t, per image.
template <typename Dtype>
class EuclideanLossLayer : public LossLayer<Dtype> {
 public:
  explicit EuclideanLossLayer(const LayerParameter& param) : LossLayer<Dtype>(param) {}
  void FurtherSetUp(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  NN_DECLARE_LOSS_LAYER_FORWARD_BACKWARD;

 private:
  Blob<Dtype> difference_;
};

// One against all: max(0, 1 - p) at the label plus max(0, 1 + p) at every
// other class, summed per image. Forward leaves these margins in the first
// bottom's gradient, and backward starts from them.
template <typename Dtype>
class HingeLossLayer : public LossLayer<Dtype> {
 public:
  explicit HingeLossLayer(const LayerParameter& param) : LossLayer<Dtype>(param) {}
  NN_DECLARE_LOSS_LAYER_FORWARD_BACKWARD;
};

// -log p at the label, p being probabilities (one label per image).
template <typename Dtype>
class MultinomialLogisticLossLayer : public LossLayer<Dtype> {
 public:
  explicit MultinomialLogisticLossLayer(const LayerParameter& param) : LossLayer<Dtype>(param) {}
  void FurtherSetUp(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  NN_DECLARE_LOSS_LAYER_FORWARD_BACKWARD;
};

// -sum_j H[label, j] log p_j, with the square matrix H read from the binary
// BlobProto file infogain_loss_param.source.
template <typename Dtype>
class InfogainLossLayer : public LossLayer<Dtype> {
 public:
  explicit InfogainLossLayer(const LayerParameter& param) : LossLayer<Dtype>(param) {}
  void FurtherSetUp(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  NN_DECLARE_LOSS_LAYER_FORWARD_BACKWARD;

 private:
  Blob<Dtype> infogain_;
};

// The cross entropy of targets t in [0, 1] against sigmoid(p), written to
// stay finite for large |p|.
template <typename Dtype>
class SigmoidCrossEntropyLossLayer : public LossLayer<Dtype> {
 public:
  explicit SigmoidCrossEntropyLossLayer(const LayerParameter& param);
  void FurtherSetUp(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  NN_DECLARE_LOSS_LAYER_FORWARD_BACKWARD;

 private:
  boost::shared_ptr<SigmoidLayer<Dtype>> sigmoid_layer_;
  boost::shared_ptr<Blob<Dtype>> sigmoid_output_;
  std::vector<Blob<Dtype>*> sigmoid_bottom_vec_;
  std::vector<Blob<Dtype>*> sigmoid_top_vec_;
};

// -log of the engine's softmax at the label. That softmax normalises the
// first image of a batch only, so the loss and its gradient are those of a
// true softmax for that image alone.
template <typename Dtype>
class SoftmaxWithLossLayer : public Layer<Dtype> {
 public:
  explicit SoftmaxWithLossLayer(const LayerParameter& param);
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;
  NN_DECLARE_LOSS_LAYER_FORWARD_BACKWARD;

 private:
  boost::shared_ptr<SoftmaxLayer<Dtype>> softmax_layer_;
  Blob<Dtype> prob_;
  std::vector<Blob<Dtype>*> softmax_bottom_vec_;
  std::vector<Blob<Dtype>*> softmax_top_vec_;
};

// Top (1, 2, 1, 1): the share of images whose highest score (the first of
// equal ones) is at the label, and the mean of -log p at the label.
template <typename Dtype>
class AccuracyLayer : public Layer<Dtype> {
 public:
  explicit AccuracyLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;
  // No gradient: backward ends the process.
  NN_DECLARE_LOSS_LAYER_FORWARD_BACKWARD;
};

#undef NN_DECLARE_LOSS_LAYER_FORWARD_BACKWARD

}  // namespace nn

#endif  // NN_LOSS_LAYERS_H_
