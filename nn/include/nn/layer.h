#ifndef NN_LAYER_H_
#define NN_LAYER_H_

#include <boost/shared_ptr.hpp>

#include <vector>

#include "nn/blob.h"
#include "nn/proto/nn.pb.h"

namespace nn {

// The base of all layers. A layer owns its learnable parameter blobs; its
// bottom and top blobs are borrowed from the net. Each SetUp checks the blob
// counts it needs and shapes its tops.
//
// Not thread-safe: a layer belongs to one net, and a net to one thread.
template <typename Dtype>
class Layer {
 public:
  // Copies the parameter; blobs it carries become the layer's parameters, so
  // a description with weights inside needs no weight file.
  explicit Layer(const LayerParameter& param);
  virtual ~Layer() = default;
  Layer(const Layer&) = delete;
  Layer& operator=(const Layer&) = delete;

  virtual void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) = 0;
  // Called after the parameter blobs were replaced by trained ones.
  virtual void UpdateOffsets() {}
  // Rewrites the tops' shape headers to follow the bottoms' (already
  // rewritten) spatial size, without touching memory. The base leaves the tops
  // alone, which is right only for layers that work in place.
  // REQUIRES: the new size is not above the size at SetUp.
  virtual void AlterInputShape(int new_width, int new_height,
                               const std::vector<Blob<Dtype>*>& bottom,
                               std::vector<Blob<Dtype>*>* top);
  // Writes the layer's parameter and its parameter blobs.
  virtual void ToProto(LayerParameter* param, bool write_diff = false);

  // Run on the device of the engine's mode; returns the layer's loss (0 for
  // all but the loss layers).
  Dtype Forward(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top);
  void Backward(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                std::vector<Blob<Dtype>*>* bottom);

  std::vector<boost::shared_ptr<Blob<Dtype>>>& blobs() { return blobs_; }
  const LayerParameter& layer_param() const { return layer_param_; }

 protected:
  virtual Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                            std::vector<Blob<Dtype>*>* top) = 0;
  // There is no device path: the GPU forms fall through to the CPU ones.
  virtual Dtype Forward_gpu(const std::vector<Blob<Dtype>*>& bottom,
                            std::vector<Blob<Dtype>*>* top) {
    return Forward_cpu(bottom, top);
  }
  virtual void Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                            std::vector<Blob<Dtype>*>* bottom) = 0;
  virtual void Backward_gpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                            std::vector<Blob<Dtype>*>* bottom) {
    Backward_cpu(top, propagate_down, bottom);
  }

  LayerParameter layer_param_;
  std::vector<boost::shared_ptr<Blob<Dtype>>> blobs_;
};

// A new layer for param.type, owned by the caller. NONE and unknown types are
// fatal; the two HDF5 types have no implementation and give a null pointer.
template <typename Dtype>
Layer<Dtype>* GetLayer(const LayerParameter& param);

}  // namespace nn

#endif  // NN_LAYER_H_
