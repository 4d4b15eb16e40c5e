#include <glog/logging.h>

#include "nn/common_layers.h"
#include "nn/util/math_functions.h"

namespace nn {

template <typename Dtype>
void ConcatLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                               std::vector<Blob<Dtype>*>* top) {
  CHECK_GT(bottom.size(), 1) << "Concat Layer takes at least two blobs as input.";
  CHECK_EQ(top->size(), 1) << "Concat Layer takes a single blob as output.";
  concat_dim_ = this->layer_param_.concat_param().concat_dim();
  CHECK_GE(concat_dim_, 0) << "concat_dim should be >= 0";
  CHECK_LE(concat_dim_, 1) << "For now concat_dim <=1, it can only concat num and channels";
  count_ = bottom[0]->count();
  num_ = bottom[0]->num();
  channels_ = bottom[0]->channels();
  height_ = bottom[0]->height();
  width_ = bottom[0]->width();
  // Only the joined dimension is summed; the others are not compared.
  for (size_t i = 1; i < bottom.size(); ++i) {
    count_ += bottom[i]->count();
    if (concat_dim_ == 0) {
      num_ += bottom[i]->num();
    } else {
      channels_ += bottom[i]->channels();
    }
  }
  (*top)[0]->Reshape(num_, channels_, height_, width_);
  CHECK_EQ(count_, (*top)[0]->count());
}

template <typename Dtype>
Dtype ConcatLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                      std::vector<Blob<Dtype>*>* top) {
  Blob<Dtype>& out = *(*top)[0];
  Dtype* top_data = out.mutable_cpu_data();
  if (concat_dim_ == 0) {
    int offset_num = 0;
    for (const Blob<Dtype>* in : bottom) {
      cblas_scopy(in->count(), in->cpu_data(), 1, top_data + out.offset(offset_num), 1);
      offset_num += in->num();
    }
  } else if (concat_dim_ == 1) {
    int offset_channel = 0;
    for (const Blob<Dtype>* in : bottom) {
      const int num_elem = in->channels() * in->height() * in->width();
      for (int n = 0; n < num_; ++n) {
        cblas_scopy(num_elem, in->cpu_data() + in->offset(n), 1,
                    top_data + out.offset(n, offset_channel), 1);
      }
      offset_channel += in->channels();
    }
  } else {
    LOG(FATAL) << "concat_dim along dim" << concat_dim_ << " not implemented yet";
  }
  return Dtype(0);
}

template <typename Dtype>
void ConcatLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                      std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  const Blob<Dtype>& out = *top[0];
  const Dtype* top_diff = out.cpu_diff();
  if (concat_dim_ == 0) {
    int offset_num = 0;
    for (Blob<Dtype>* in : *bottom) {
      cblas_scopy(in->count(), top_diff + out.offset(offset_num), 1, in->mutable_cpu_diff(), 1);
      offset_num += in->num();
    }
  } else if (concat_dim_ == 1) {
    int offset_channel = 0;
    for (Blob<Dtype>* in : *bottom) {
      const int num_elem = in->channels() * in->height() * in->width();
      for (int n = 0; n < num_; ++n) {
        cblas_scopy(num_elem, top_diff + out.offset(n, offset_channel), 1,
                    in->mutable_cpu_diff() + in->offset(n), 1);
      }
      offset_channel += in->channels();
    }
  } else {
    LOG(FATAL) << "concat_dim along dim" << concat_dim_ << " not implemented yet";
  }
}

template class ConcatLayer<float>;

}  // namespace nn
