#include <glog/logging.h>

#include "nn/data_layers.h"

namespace nn {

template <typename Dtype>
void MemoryDataLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                                   std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 0) << "Memory Data Layer takes no blobs as input.";
  CHECK_EQ(top->size(), 2) << "Memory Data Layer takes two blobs as output.";
  const MemoryDataParameter& param = this->layer_param_.memory_data_param();
  batch_size_ = param.batch_size();
  datum_channels_ = param.channels();
  datum_height_ = param.height();
  datum_width_ = param.width();
  datum_size_ = datum_channels_ * datum_height_ * datum_width_;
  CHECK_GT(batch_size_ * datum_size_, 0)
      << "batch_size, channels, height, and width must be specified and positive in "
         "memory_data_param";
  (*top)[0]->Reshape(batch_size_, datum_channels_, datum_height_, datum_width_);
  (*top)[1]->Reshape(batch_size_, 1, 1, 1);
  data_ = nullptr;
  labels_ = nullptr;
}

template <typename Dtype>
Dtype MemoryDataLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>&,
                                          std::vector<Blob<Dtype>*>* top) {
  // Nothing hands this layer an array, so this is where every pass ends.
  CHECK(data_) << "MemoryDataLayer needs to be initalized by calling Reset";
  (*top)[0]->set_cpu_data(data_ + pos_ * datum_size_);
  (*top)[1]->set_cpu_data(labels_ + pos_);
  pos_ = (pos_ + batch_size_) % n_;
  return Dtype(0);
}

template class MemoryDataLayer<float>;

}  // namespace nn
