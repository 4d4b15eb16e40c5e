#ifndef NN_COMMON_LAYERS_H_
#define NN_COMMON_LAYERS_H_

#include <boost/shared_ptr.hpp>

#include <vector>

#include "nn/blob.h"
#include "nn/layer.h"
#include "nn/syncedmem.h"

namespace nn {

// A fully connected layer: each image, taken as a flat row, times the weights
// (num_output by inputs), plus the bias.
template <typename Dtype>
class InnerProductLayer : public Layer<Dtype> {
 public:
  explicit InnerProductLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;

 private:
  int M_ = 0;
  int K_ = 0;
  int N_ = 0;
  bool bias_term_ = true;
  boost::shared_ptr<SyncedMemory> bias_multiplier_;
};

// Softmax across channels at each spatial position. It subtracts one maximum
// per image (not per position) and normalises the first image of the batch
// only; trained models and the detector rely on exactly this.
template <typename Dtype>
class SoftmaxLayer : public Layer<Dtype> {
 public:
  explicit SoftmaxLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;
  void AlterInputShape(int new_width, int new_height, const std::vector<Blob<Dtype>*>& bottom,
                       std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;

 private:
  Blob<Dtype> sum_multiplier_;
  Blob<Dtype> scale_;
  Blob<Dtype> channel_sum_;
};

// Joins its bottoms along num (concat_dim 0) or channels (concat_dim 1).
template <typename Dtype>
class ConcatLayer : public Layer<Dtype> {
 public:
  explicit ConcatLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;

 private:
  int count_ = 0;
  int num_ = 0;
  int channels_ = 0;
  int height_ = 0;
  int width_ = 0;
  int concat_dim_ = 0;
};

// Hands one blob to several consumers by sharing its data; inserted by the
// net where a blob feeds several layers.
template <typename Dtype>
class SplitLayer : public Layer<Dtype> {
 public:
  explicit SplitLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;

 private:
  int count_ = 0;
};

// Views each image as a (num, channels * height * width, 1, 1) vector.
template <typename Dtype>
class FlattenLayer : public Layer<Dtype> {
 public:
  explicit FlattenLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;

 private:
  int count_ = 0;
};

// The element-wise product of two or more blobs of one shape.
template <typename Dtype>
class EltwiseProductLayer : public Layer<Dtype> {
 public:
  explicit EltwiseProductLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;
};

}  // namespace nn

#endif  // NN_COMMON_LAYERS_H_
