#include <glog/logging.h>

#include "nn/util/math_functions.h"
#include "nn/vision_layers.h"

namespace nn {

template <typename Dtype>
void Im2colLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                               std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 1) << "Im2col Layer takes a single blob as input.";
  CHECK_EQ(top->size(), 1) << "Im2col Layer takes a single blob as output.";
  const ConvolutionParameter& param = this->layer_param_.convolution_param();
  kernel_size_ = param.kernel_size();
  stride_ = param.stride();
  pad_ = param.pad();
  channels_ = bottom[0]->channels();
  height_ = bottom[0]->height();
  width_ = bottom[0]->width();
  (*top)[0]->Reshape(bottom[0]->num(), channels_ * kernel_size_ * kernel_size_,
                     (height_ + 2 * pad_ - kernel_size_) / stride_ + 1,
                     (width_ + 2 * pad_ - kernel_size_) / stride_ + 1);
}

template <typename Dtype>
Dtype Im2colLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                      std::vector<Blob<Dtype>*>* top) {
  const Dtype* bottom_data = bottom[0]->cpu_data();
  Dtype* top_data = (*top)[0]->mutable_cpu_data();
  for (int n = 0; n < bottom[0]->num(); ++n) {
    im2col(bottom_data + bottom[0]->offset(n), channels_, height_, width_, kernel_size_, pad_,
           stride_, top_data + (*top)[0]->offset(n));
  }
  return Dtype(0);
}

template <typename Dtype>
void Im2colLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                      std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  const Dtype* top_diff = top[0]->cpu_diff();
  Dtype* bottom_diff = (*bottom)[0]->mutable_cpu_diff();
  for (int n = 0; n < top[0]->num(); ++n) {
    col2im(top_diff + top[0]->offset(n), channels_, height_, width_, kernel_size_, pad_, stride_,
           bottom_diff + (*bottom)[0]->offset(n));
  }
}

template class Im2colLayer<float>;

}  // namespace nn
