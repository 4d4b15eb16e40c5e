#include "nn/layer.h"

#include <glog/logging.h>

#include "nn/engine.h"

namespace nn {

template <typename Dtype>
Layer<Dtype>::Layer(const LayerParameter& param) : layer_param_(param) {
  for (const BlobProto& proto : layer_param_.blobs()) {
    blobs_.emplace_back(new Blob<Dtype>());
    blobs_.back()->FromProto(proto);
  }
}

template <typename Dtype>
void Layer<Dtype>::AlterInputShape(int, int, const std::vector<Blob<Dtype>*>&,
                                   std::vector<Blob<Dtype>*>*) {}

template <typename Dtype>
void Layer<Dtype>::ToProto(LayerParameter* param, bool write_diff) {
  param->Clear();
  param->CopyFrom(layer_param_);
  param->clear_blobs();
  for (const auto& blob : blobs_) {
    blob->ToProto(param->add_blobs(), write_diff);
  }
}

template <typename Dtype>
Dtype Layer<Dtype>::Forward(const std::vector<Blob<Dtype>*>& bottom,
                            std::vector<Blob<Dtype>*>* top) {
  switch (Engine::mode()) {
    case Engine::CPU:
      return Forward_cpu(bottom, top);
    case Engine::GPU:
      return Forward_gpu(bottom, top);
  }
  LOG(FATAL) << "Unknown engine mode.";
  return Dtype(0);
}

template <typename Dtype>
void Layer<Dtype>::Backward(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                            std::vector<Blob<Dtype>*>* bottom) {
  switch (Engine::mode()) {
    case Engine::CPU:
      Backward_cpu(top, propagate_down, bottom);
      return;
    case Engine::GPU:
      Backward_gpu(top, propagate_down, bottom);
      return;
  }
  LOG(FATAL) << "Unknown engine mode.";
}

template class Layer<float>;

}  // namespace nn
