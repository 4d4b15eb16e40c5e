#ifndef NN_VISION_LAYERS_H_
#define NN_VISION_LAYERS_H_

#include <boost/shared_ptr.hpp>

#include <vector>

#include "nn/blob.h"
#include "nn/layer.h"
#include "nn/neuron_layers.h"
#include "nn/common_layers.h"
#include "nn/syncedmem.h"

namespace nn {

// The binarized convolution of the first layer. No file feeds it and nothing
// constructs one: the slot is kept, and reaching it is an error.
template <typename Dtype>
class BinaryConvolver {
 public:
  void Convolve(Dtype* top);
};

// Convolution as a lowering to matrix products: each image is unfolded with
// im2col and each group is one product. It can be told a smaller spatial size
// after SetUp (AlterInputShape) without allocating anything.
template <typename Dtype>
class ConvolutionLayer : public Layer<Dtype> {
 public:
  explicit ConvolutionLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;
  void UpdateOffsets() override;
  void AlterInputShape(int new_width, int new_height, const std::vector<Blob<Dtype>*>& bottom,
                       std::vector<Blob<Dtype>*>* top) override;
  // Unreachable: no binarizer is ever assigned.
  virtual Dtype Forward_binarized(const std::vector<Blob<Dtype>*>& bottom,
                                  std::vector<Blob<Dtype>*>* top);
  // Refuses a first layer with several groups, which binarization can't take.
  void CheckBinarization();

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;

 private:
  void AddBias(Dtype* top_image);

  int kernel_size_ = 0;
  int stride_ = 0;
  int num_ = 0;
  int channels_ = 0;
  int pad_ = 0;
  int height_ = 0;
  int width_ = 0;
  int num_output_ = 0;
  int group_ = 0;
  Blob<Dtype> col_buffer_;
  boost::shared_ptr<SyncedMemory> bias_multiplier_;
  bool bias_term_ = true;
  int M_ = 0;
  int K_ = 0;
  int N_ = 0;
  // Strides between groups; set by UpdateOffsets only, so a grouped layer
  // that never received weights runs every group on the first one's slices.
  int weight_offset_ = 0;
  int col_offset_ = 0;
  int top_offset_ = 0;
  boost::shared_ptr<BinaryConvolver<Dtype>> binarizer_;
};

// MAX or AVE pooling over square windows. Output sizes round up, so a last
// window may hang over the edge.
template <typename Dtype>
class PoolingLayer : public Layer<Dtype> {
 public:
  explicit PoolingLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;
  void AlterInputShape(int new_width, int new_height, const std::vector<Blob<Dtype>*>& bottom,
                       std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;

 private:
  void ComputePooledSize();
  void MaxPoolPlane(const Dtype* bottom, Dtype* top);

  int kernel_size_ = 0;
  int stride_ = 0;
  int pad_ = 0;
  int channels_ = 0;
  int height_ = 0;
  int width_ = 0;
  int pooled_height_ = 0;
  int pooled_width_ = 0;
  Blob<Dtype> rand_idx_;
  // One row of column maxima, for the widest input (set-up's).
  std::vector<Dtype> column_max_;
};

// Local response normalisation, across channels (by a sliding window sum of
// squares) or within each channel (by a chain of inner layers).
template <typename Dtype>
class LRNLayer : public Layer<Dtype> {
 public:
  explicit LRNLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;
  void AlterInputShape(int new_width, int new_height, const std::vector<Blob<Dtype>*>& bottom,
                       std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;
  virtual Dtype CrossChannelForward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                        std::vector<Blob<Dtype>*>* top);
  virtual Dtype WithinChannelForward(const std::vector<Blob<Dtype>*>& bottom,
                                     std::vector<Blob<Dtype>*>* top);
  virtual void CrossChannelBackward_cpu(const std::vector<Blob<Dtype>*>& top,
                                        bool propagate_down, std::vector<Blob<Dtype>*>* bottom);
  virtual void WithinChannelBackward(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                     std::vector<Blob<Dtype>*>* bottom);

 private:
  void ReadShapeAndParameters(const std::vector<Blob<Dtype>*>& bottom,
                              std::vector<Blob<Dtype>*>* top);
  void SetUpWithinChannel(const std::vector<Blob<Dtype>*>& bottom,
                          std::vector<Blob<Dtype>*>* top);
  void CheckInnerShape(const Blob<Dtype>& blob) const;

  int size_ = 0;
  int pre_pad_ = 0;
  Dtype alpha_ = 0;
  Dtype beta_ = 0;
  int num_ = 0;
  int channels_ = 0;
  int height_ = 0;
  int width_ = 0;
  Blob<Dtype> scale_;

  // The within-channel form: x * (1 + alpha * avg_pool(x^2)) ^ -beta.
  boost::shared_ptr<SplitLayer<Dtype>> split_layer_;
  std::vector<Blob<Dtype>*> split_top_vec_;
  boost::shared_ptr<PowerLayer<Dtype>> square_layer_;
  Blob<Dtype> square_input_;
  Blob<Dtype> square_output_;
  std::vector<Blob<Dtype>*> square_bottom_vec_;
  std::vector<Blob<Dtype>*> square_top_vec_;
  boost::shared_ptr<PoolingLayer<Dtype>> pool_layer_;
  Blob<Dtype> pool_output_;
  std::vector<Blob<Dtype>*> pool_top_vec_;
  boost::shared_ptr<PowerLayer<Dtype>> power_layer_;
  Blob<Dtype> power_output_;
  std::vector<Blob<Dtype>*> power_top_vec_;
  boost::shared_ptr<EltwiseProductLayer<Dtype>> product_layer_;
  std::vector<Blob<Dtype>*> product_bottom_vec_;
};

// Unfolds each image into the column layout of the convolution.
template <typename Dtype>
class Im2colLayer : public Layer<Dtype> {
 public:
  explicit Im2colLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                    std::vector<Blob<Dtype>*>* bottom) override;

 private:
  int kernel_size_ = 0;
  int stride_ = 0;
  int channels_ = 0;
  int height_ = 0;
  int width_ = 0;
  int pad_ = 0;
};

}  // namespace nn

#endif  // NN_VISION_LAYERS_H_
