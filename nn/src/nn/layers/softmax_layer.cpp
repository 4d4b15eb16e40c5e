#include <glog/logging.h>

#include <algorithm>

#include "nn/common_layers.h"
#include "nn/util/math_functions.h"

namespace nn {

template <typename Dtype>
void SoftmaxLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                                std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 1) << "Softmax Layer takes a single blob as input.";
  CHECK_EQ(top->size(), 1) << "Softmax Layer takes a single blob as output.";
  const Blob<Dtype>& in = *bottom[0];
  (*top)[0]->Reshape(in.num(), in.channels(), in.height(), in.width());
  sum_multiplier_.Reshape(1, in.channels(), in.height(), in.width());
  Dtype* multiplier = sum_multiplier_.mutable_cpu_data();
  std::fill(multiplier, multiplier + sum_multiplier_.count(), Dtype(1));
  scale_.Reshape(in.num(), 1, 1, 1);
  // Used by count alone; width stands in the height place.
  channel_sum_.Reshape(1, 1, in.width(), in.height());
  CHECK_GE((*top)[0]->channels(), 2) << "Softmax Layer takes more than two-channels output.";
}

template <typename Dtype>
void SoftmaxLayer<Dtype>::AlterInputShape(int, int, const std::vector<Blob<Dtype>*>& bottom,
                                          std::vector<Blob<Dtype>*>* top) {
  const Blob<Dtype>& in = *bottom[0];
  (*top)[0]->RewriteShape(in.num(), in.channels(), in.height(), in.width());
  sum_multiplier_.RewriteShape(1, in.channels(), in.height(), in.width());
  scale_.RewriteShape(in.num(), 1, 1, 1);
  channel_sum_.RewriteShape(1, 1, in.width(), in.height());
}

template <typename Dtype>
Dtype SoftmaxLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                       std::vector<Blob<Dtype>*>* top) {
  const Dtype* bottom_data = bottom[0]->cpu_data();
  Dtype* top_data = (*top)[0]->mutable_cpu_data();
  Dtype* scale_data = scale_.mutable_cpu_data();
  const int num = bottom[0]->num();
  const int channels = bottom[0]->channels();
  const int dim = bottom[0]->count() / num;
  const int spatial = bottom[0]->height() * bottom[0]->width();
  std::copy(bottom_data, bottom_data + bottom[0]->count(), top_data);
  // One maximum per image, over channels and positions together.
  for (int i = 0; i < num; ++i) {
    scale_data[i] = bottom_data[i * dim];
    for (int j = 0; j < dim; ++j) {
      if (bottom_data[i * dim + j] > scale_data[i]) {
        scale_data[i] = bottom_data[i * dim + j];
      }
    }
  }
  cblas_sgemm(CblasRowMajor, CblasNoTrans, CblasNoTrans, num, dim, 1, -1.0f, scale_data, 1,
              sum_multiplier_.cpu_data(), dim, 1.0f, top_data, dim);
  vsExp(num * dim, top_data, top_data);
  // The sums and the division cover the first image only; later images stay
  // unnormalised exponentials.
  Dtype* channel_sum = channel_sum_.mutable_cpu_data();
  vsAdd(spatial, top_data, top_data + spatial, channel_sum);
  for (int c = 2; c < channels; ++c) {
    vsAdd(spatial, top_data + c * spatial, channel_sum, channel_sum);
  }
  for (int c = 0; c < channels; ++c) {
    vsDiv(spatial, top_data + c * spatial, channel_sum, top_data + c * spatial);
  }
  return Dtype(0);
}

// The adjoint of the forward pass as it is: per position across channels for
// the first image, and of exp(x - max) for the later ones.
template <typename Dtype>
void SoftmaxLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                       std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  const Dtype* top_diff = top[0]->cpu_diff();
  const Dtype* top_data = top[0]->cpu_data();
  const Dtype* bottom_data = (*bottom)[0]->cpu_data();
  Dtype* bottom_diff = (*bottom)[0]->mutable_cpu_diff();
  const int num = top[0]->num();
  const int channels = top[0]->channels();
  const int dim = top[0]->count() / num;
  const int spatial = top[0]->height() * top[0]->width();
  vsMul(top[0]->count(), top_diff, top_data, bottom_diff);

  for (int p = 0; p < spatial; ++p) {
    Dtype dot = 0;
    for (int c = 0; c < channels; ++c) {
      dot += bottom_diff[c * spatial + p];
    }
    for (int c = 0; c < channels; ++c) {
      bottom_diff[c * spatial + p] -= top_data[c * spatial + p] * dot;
    }
  }
  for (int i = 1; i < num; ++i) {
    int argmax = 0;
    Dtype sum = 0;
    for (int j = 0; j < dim; ++j) {
      if (bottom_data[i * dim + j] > bottom_data[i * dim + argmax]) {
        argmax = j;
      }
      sum += bottom_diff[i * dim + j];
    }
    bottom_diff[i * dim + argmax] -= sum;
  }
}

template class SoftmaxLayer<float>;

}  // namespace nn
