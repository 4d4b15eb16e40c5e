#include <glog/logging.h>

#include <algorithm>
#include <cmath>
#include <limits>

#include "nn/vision_layers.h"

namespace nn {

template <typename Dtype>
void PoolingLayer<Dtype>::ComputePooledSize() {
  // Rounded up, unlike the convolution: a last window may start at the edge.
  pooled_height_ = static_cast<int>(std::ceil(static_cast<float>(height_ + 2 * pad_ - kernel_size_) /
                                              static_cast<float>(stride_))) +
                   1;
  pooled_width_ = static_cast<int>(std::ceil(static_cast<float>(width_ + 2 * pad_ - kernel_size_) /
                                             static_cast<float>(stride_))) +
                  1;
}

template <typename Dtype>
void PoolingLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                                std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 1) << "PoolingLayer takes a single blob as input.";
  CHECK_EQ(top->size(), 1) << "PoolingLayer takes a single blob as output.";
  const PoolingParameter& param = this->layer_param_.pooling_param();
  kernel_size_ = param.kernel_size();
  stride_ = param.stride();
  pad_ = param.pad();
  if (pad_ != 0) {
    CHECK_EQ(this->layer_param_.pooling_param().pool(), PoolingParameter_PoolMethod_AVE)
        << "Padding implemented only for average pooling.";
  }
  channels_ = bottom[0]->channels();
  height_ = bottom[0]->height();
  width_ = bottom[0]->width();
  ComputePooledSize();
  column_max_.resize(width_);
  (*top)[0]->Reshape(bottom[0]->num(), channels_, pooled_height_, pooled_width_);
  if (param.pool() == PoolingParameter_PoolMethod_STOCHASTIC) {
    rand_idx_.Reshape(bottom[0]->num(), channels_, pooled_height_, pooled_width_);
  }
}

template <typename Dtype>
void PoolingLayer<Dtype>::AlterInputShape(int, int, const std::vector<Blob<Dtype>*>& bottom,
                                          std::vector<Blob<Dtype>*>* top) {
  height_ = bottom[0]->height();
  width_ = bottom[0]->width();
  ComputePooledSize();
  (*top)[0]->RewriteShape(bottom[0]->num(), channels_, pooled_height_, pooled_width_);
}

namespace {

// The window of output cell (ph, pw) for AVE, with its divisor taken before
// clipping so that padding cells count.
struct AverageWindow {
  int hstart, hend, wstart, wend, pool_size;
};

AverageWindow AveWindow(int ph, int pw, int stride, int pad, int kernel_size, int height,
                        int width) {
  AverageWindow window;
  window.hstart = ph * stride - pad;
  window.wstart = pw * stride - pad;
  window.hend = std::min(window.hstart + kernel_size, height + pad);
  window.wend = std::min(window.wstart + kernel_size, width + pad);
  window.pool_size = (window.hend - window.hstart) * (window.wend - window.wstart);
  window.hstart = std::max(window.hstart, 0);
  window.wstart = std::max(window.wstart, 0);
  window.hend = std::min(window.hend, height);
  window.wend = std::min(window.wend, width);
  return window;
}

}  // namespace

// The maximum of the window's rows first, column by column (a loop the
// compiler turns into vector maxima), then of those along each window. Taking
// the maximum in another order gives the same value: the comparison is
// strictly greater, so a NaN never enters either way.
template <typename Dtype>
void PoolingLayer<Dtype>::MaxPoolPlane(const Dtype* bottom, Dtype* top) {
  Dtype* column_max = column_max_.data();
  for (int ph = 0; ph < pooled_height_; ++ph) {
    const int hstart = ph * stride_;
    const int hend = std::min(hstart + kernel_size_, height_);
    // A window wholly outside the image keeps the lowest float.
    std::fill(column_max, column_max + width_, std::numeric_limits<Dtype>::lowest());
    for (int h = hstart; h < hend; ++h) {
      const Dtype* row = bottom + h * width_;
      for (int w = 0; w < width_; ++w) {
        column_max[w] = row[w] > column_max[w] ? row[w] : column_max[w];
      }
    }
    for (int pw = 0; pw < pooled_width_; ++pw) {
      const int wstart = pw * stride_;
      const int wend = std::min(wstart + kernel_size_, width_);
      Dtype out = std::numeric_limits<Dtype>::lowest();
      for (int w = wstart; w < wend; ++w) {
        out = column_max[w] > out ? column_max[w] : out;
      }
      top[ph * pooled_width_ + pw] = out;
    }
  }
}

template <typename Dtype>
Dtype PoolingLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                       std::vector<Blob<Dtype>*>* top) {
  const Dtype* bottom_data = bottom[0]->cpu_data();
  Dtype* top_data = (*top)[0]->mutable_cpu_data();
  const int images = bottom[0]->num();
  switch (this->layer_param_.pooling_param().pool()) {
    case PoolingParameter_PoolMethod_MAX:
      for (int plane = 0; plane < images * channels_; ++plane) {
        MaxPoolPlane(bottom_data, top_data);
        bottom_data += height_ * width_;
        top_data += pooled_height_ * pooled_width_;
      }
      break;
    case PoolingParameter_PoolMethod_AVE:
      std::fill(top_data, top_data + (*top)[0]->count(), Dtype(0));
      for (int n = 0; n < images; ++n) {
        for (int c = 0; c < channels_; ++c) {
          for (int ph = 0; ph < pooled_height_; ++ph) {
            for (int pw = 0; pw < pooled_width_; ++pw) {
              const AverageWindow window =
                  AveWindow(ph, pw, stride_, pad_, kernel_size_, height_, width_);
              Dtype& out = top_data[ph * pooled_width_ + pw];
              for (int h = window.hstart; h < window.hend; ++h) {
                for (int w = window.wstart; w < window.wend; ++w) {
                  out += bottom_data[h * width_ + w];
                }
              }
              out /= static_cast<Dtype>(window.pool_size);
            }
          }
          bottom_data += height_ * width_;
          top_data += pooled_height_ * pooled_width_;
        }
      }
      break;
    case PoolingParameter_PoolMethod_STOCHASTIC:
      LOG(FATAL) << "Not Implemented Yet";
      break;
    default:
      LOG(FATAL) << "Unknown pooling method.";
  }
  return Dtype(0);
}

template <typename Dtype>
void PoolingLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                       std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  const Dtype* top_diff = top[0]->cpu_diff();
  const Dtype* top_data = top[0]->cpu_data();
  const Dtype* bottom_data = (*bottom)[0]->cpu_data();
  Dtype* bottom_diff = (*bottom)[0]->mutable_cpu_diff();
  std::fill(bottom_diff, bottom_diff + (*bottom)[0]->count(), Dtype(0));
  const int images = top[0]->num();
  switch (this->layer_param_.pooling_param().pool()) {
    case PoolingParameter_PoolMethod_MAX:
      for (int n = 0; n < images; ++n) {
        for (int c = 0; c < channels_; ++c) {
          for (int ph = 0; ph < pooled_height_; ++ph) {
            const int hstart = ph * stride_;
            const int hend = std::min(hstart + kernel_size_, height_);
            for (int pw = 0; pw < pooled_width_; ++pw) {
              const int wstart = pw * stride_;
              const int wend = std::min(wstart + kernel_size_, width_);
              const int index = ph * pooled_width_ + pw;
              for (int h = hstart; h < hend; ++h) {
                for (int w = wstart; w < wend; ++w) {
                  if (bottom_data[h * width_ + w] == top_data[index]) {
                    bottom_diff[h * width_ + w] += top_diff[index];
                  }
                }
              }
            }
          }
          bottom_data += height_ * width_;
          bottom_diff += height_ * width_;
          top_data += pooled_height_ * pooled_width_;
          top_diff += pooled_height_ * pooled_width_;
        }
      }
      break;
    case PoolingParameter_PoolMethod_AVE:
      for (int n = 0; n < images; ++n) {
        for (int c = 0; c < channels_; ++c) {
          for (int ph = 0; ph < pooled_height_; ++ph) {
            for (int pw = 0; pw < pooled_width_; ++pw) {
              const AverageWindow window =
                  AveWindow(ph, pw, stride_, pad_, kernel_size_, height_, width_);
              const Dtype share =
                  top_diff[ph * pooled_width_ + pw] / static_cast<Dtype>(window.pool_size);
              for (int h = window.hstart; h < window.hend; ++h) {
                for (int w = window.wstart; w < window.wend; ++w) {
                  bottom_diff[h * width_ + w] += share;
                }
              }
            }
          }
          bottom_diff += height_ * width_;
          top_diff += pooled_height_ * pooled_width_;
        }
      }
      break;
    case PoolingParameter_PoolMethod_STOCHASTIC:
      LOG(FATAL) << "Not Implemented Yet";
      break;
    default:
      LOG(FATAL) << "Unknown pooling method.";
  }
}

template class PoolingLayer<float>;

}  // namespace nn
