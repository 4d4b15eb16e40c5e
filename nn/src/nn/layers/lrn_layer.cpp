#include <glog/logging.h>

#include <algorithm>

#include "nn/util/math_functions.h"
#include "nn/vision_layers.h"

namespace nn {

template <typename Dtype>
void LRNLayer<Dtype>::ReadShapeAndParameters(const std::vector<Blob<Dtype>*>& bottom,
                                             std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 1)
      << "Local Response Normalization Layer takes a single blob as input.";
  CHECK_EQ(top->size(), 1) << "Local Response Normalization Layer takes a single blob as output.";
  num_ = bottom[0]->num();
  channels_ = bottom[0]->channels();
  height_ = bottom[0]->height();
  width_ = bottom[0]->width();
  const LRNParameter& param = this->layer_param_.lrn_param();
  size_ = param.local_size();
  // An even size leaves the window one short on the leading side.
  pre_pad_ = (size_ - 1) / 2;
  alpha_ = param.alpha();
  beta_ = param.beta();
}

template <typename Dtype>
void LRNLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                            std::vector<Blob<Dtype>*>* top) {
  ReadShapeAndParameters(bottom, top);
  switch (this->layer_param_.lrn_param().norm_region()) {
    case LRNParameter_NormRegion_ACROSS_CHANNELS:
      (*top)[0]->Reshape(num_, channels_, height_, width_);
      scale_.Reshape(num_, channels_, height_, width_);
      break;
    case LRNParameter_NormRegion_WITHIN_CHANNEL:
      SetUpWithinChannel(bottom, top);
      break;
    default:
      LOG(FATAL) << "Unknown normalization region.";
  }
}

template <typename Dtype>
void LRNLayer<Dtype>::CheckInnerShape(const Blob<Dtype>& blob) const {
  CHECK_EQ(blob.num(), num_);
  CHECK_EQ(blob.channels(), channels_);
  CHECK_EQ(blob.height(), height_);
  CHECK_EQ(blob.width(), width_);
}

template <typename Dtype>
void LRNLayer<Dtype>::SetUpWithinChannel(const std::vector<Blob<Dtype>*>& bottom,
                                         std::vector<Blob<Dtype>*>* top) {
  // The bottom goes on in place to the product; a copy goes to the squares.
  LayerParameter split_param;
  split_layer_.reset(new SplitLayer<Dtype>(split_param));
  split_top_vec_ = {bottom[0], &square_input_};
  split_layer_->SetUp(bottom, &split_top_vec_);

  LayerParameter square_param;
  square_param.mutable_power_param()->set_power(Dtype(2));
  square_layer_.reset(new PowerLayer<Dtype>(square_param));
  square_bottom_vec_ = {&square_input_};
  square_top_vec_ = {&square_output_};
  square_layer_->SetUp(square_bottom_vec_, &square_top_vec_);
  CheckInnerShape(square_output_);

  LayerParameter pool_param;
  pool_param.mutable_pooling_param()->set_pool(PoolingParameter_PoolMethod_AVE);
  pool_param.mutable_pooling_param()->set_pad(pre_pad_);
  pool_param.mutable_pooling_param()->set_kernel_size(size_);
  pool_layer_.reset(new PoolingLayer<Dtype>(pool_param));
  pool_top_vec_ = {&pool_output_};
  pool_layer_->SetUp(square_top_vec_, &pool_top_vec_);
  CheckInnerShape(pool_output_);

  LayerParameter power_param;
  power_param.mutable_power_param()->set_power(-beta_);
  power_param.mutable_power_param()->set_scale(alpha_);
  power_param.mutable_power_param()->set_shift(Dtype(1));
  power_layer_.reset(new PowerLayer<Dtype>(power_param));
  power_top_vec_ = {&power_output_};
  power_layer_->SetUp(pool_top_vec_, &power_top_vec_);
  CheckInnerShape(power_output_);

  LayerParameter product_param;
  product_layer_.reset(new EltwiseProductLayer<Dtype>(product_param));
  product_bottom_vec_ = {bottom[0], &power_output_};
  product_layer_->SetUp(product_bottom_vec_, top);
  CHECK_EQ((*top)[0]->num(), num_);
  CHECK_EQ((*top)[0]->channels(), channels_);
  CHECK_EQ((*top)[0]->height(), height_);
  CHECK_EQ((*top)[0]->width(), width_);
}

template <typename Dtype>
void LRNLayer<Dtype>::AlterInputShape(int, int, const std::vector<Blob<Dtype>*>& bottom,
                                      std::vector<Blob<Dtype>*>* top) {
  ReadShapeAndParameters(bottom, top);
  (*top)[0]->RewriteShape(num_, channels_, height_, width_);
  scale_.RewriteShape(num_, channels_, height_, width_);
}

template <typename Dtype>
Dtype LRNLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                   std::vector<Blob<Dtype>*>* top) {
  switch (this->layer_param_.lrn_param().norm_region()) {
    case LRNParameter_NormRegion_ACROSS_CHANNELS:
      return CrossChannelForward_cpu(bottom, top);
    case LRNParameter_NormRegion_WITHIN_CHANNEL:
      return WithinChannelForward(bottom, top);
    default:
      LOG(FATAL) << "Unknown normalization region.";
  }
  return Dtype(0);
}

template <typename Dtype>
Dtype LRNLayer<Dtype>::CrossChannelForward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                               std::vector<Blob<Dtype>*>* top) {
  const Dtype* bottom_data = bottom[0]->cpu_data();
  Dtype* top_data = (*top)[0]->mutable_cpu_data();
  Dtype* scale_data = scale_.mutable_cpu_data();
  std::fill(scale_data, scale_data + scale_.count(), Dtype(1));
  const int spatial = height_ * width_;
  Blob<Dtype> padded_square(1, channels_ + size_ - 1, height_, width_);
  Dtype* padded_square_data = padded_square.mutable_cpu_data();
  const Dtype alpha_over_size = alpha_ / static_cast<Dtype>(size_);
  for (int n = 0; n < num_; ++n) {
    vsSqr(channels_ * spatial, bottom_data + bottom[0]->offset(n),
          padded_square_data + padded_square.offset(0, pre_pad_));
    for (int c = 0; c < size_; ++c) {
      cblas_saxpy(spatial, alpha_over_size, padded_square_data + padded_square.offset(0, c), 1,
                  scale_data + scale_.offset(n, 0), 1);
    }
    // A sliding window over channels: add the entering square, remove the
    // leaving one. The running rounding is part of the trained behaviour.
    for (int c = 1; c < channels_; ++c) {
      cblas_scopy(spatial, scale_data + scale_.offset(n, c - 1), 1,
                  scale_data + scale_.offset(n, c), 1);
      cblas_saxpy(spatial, alpha_over_size,
                  padded_square_data + padded_square.offset(0, c + size_ - 1), 1,
                  scale_data + scale_.offset(n, c), 1);
      cblas_saxpy(spatial, -alpha_over_size, padded_square_data + padded_square.offset(0, c - 1),
                  1, scale_data + scale_.offset(n, c), 1);
    }
  }
  vsPowx(scale_.count(), scale_data, -beta_, top_data);
  vsMul(scale_.count(), top_data, bottom_data, top_data);
  return Dtype(0);
}

template <typename Dtype>
Dtype LRNLayer<Dtype>::WithinChannelForward(const std::vector<Blob<Dtype>*>& bottom,
                                            std::vector<Blob<Dtype>*>* top) {
  split_layer_->Forward(bottom, &split_top_vec_);
  square_layer_->Forward(square_bottom_vec_, &square_top_vec_);
  pool_layer_->Forward(square_top_vec_, &pool_top_vec_);
  power_layer_->Forward(pool_top_vec_, &power_top_vec_);
  product_layer_->Forward(product_bottom_vec_, top);
  return Dtype(0);
}

template <typename Dtype>
void LRNLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                   std::vector<Blob<Dtype>*>* bottom) {
  switch (this->layer_param_.lrn_param().norm_region()) {
    case LRNParameter_NormRegion_ACROSS_CHANNELS:
      CrossChannelBackward_cpu(top, propagate_down, bottom);
      break;
    case LRNParameter_NormRegion_WITHIN_CHANNEL:
      WithinChannelBackward(top, propagate_down, bottom);
      break;
    default:
      LOG(FATAL) << "Unknown normalization region.";
  }
}

// With s the scale and y = x * s^-beta:
// dx_c = g_c * s_c^-beta - (2 * alpha * beta / size) * x_c * sum over the
// windows holding c of g_k * y_k / s_k.
template <typename Dtype>
void LRNLayer<Dtype>::CrossChannelBackward_cpu(const std::vector<Blob<Dtype>*>& top,
                                               bool propagate_down,
                                               std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  const Dtype* top_diff = top[0]->cpu_diff();
  const Dtype* top_data = top[0]->cpu_data();
  const Dtype* bottom_data = (*bottom)[0]->cpu_data();
  const Dtype* scale_data = scale_.cpu_data();
  Dtype* bottom_diff = (*bottom)[0]->mutable_cpu_diff();
  const int spatial = height_ * width_;
  Blob<Dtype> padded_ratio(1, channels_ + size_ - 1, height_, width_);
  Blob<Dtype> accum_ratio(1, 1, height_, width_);
  Dtype* padded_ratio_data = padded_ratio.mutable_cpu_data();
  Dtype* accum_ratio_data = accum_ratio.mutable_cpu_data();
  // Channels before the first and after the last stay zero: no window term.
  const int inverse_pre_pad = size_ - 1 - pre_pad_;
  const Dtype cache_ratio = Dtype(2) * alpha_ * beta_ / static_cast<Dtype>(size_);

  vsPowx(scale_.count(), scale_data, -beta_, bottom_diff);
  vsMul(scale_.count(), top_diff, bottom_diff, bottom_diff);
  for (int n = 0; n < num_; ++n) {
    const int block = (*bottom)[0]->offset(n);
    Dtype* ratio = padded_ratio_data + padded_ratio.offset(0, inverse_pre_pad);
    vsMul(channels_ * spatial, top_diff + block, top_data + block, ratio);
    vsDiv(channels_ * spatial, ratio, scale_data + block, ratio);
    // The window of input channel c is output channels c - size_ + 1 + pre_pad_
    // to c + pre_pad_; the padded copy makes the sum a sliding one again.
    std::fill(accum_ratio_data, accum_ratio_data + spatial, Dtype(0));
    for (int c = 0; c < size_ - 1; ++c) {
      cblas_saxpy(spatial, 1.0f, padded_ratio_data + padded_ratio.offset(0, c), 1,
                  accum_ratio_data, 1);
    }
    for (int c = 0; c < channels_; ++c) {
      cblas_saxpy(spatial, 1.0f, padded_ratio_data + padded_ratio.offset(0, c + size_ - 1), 1,
                  accum_ratio_data, 1);
      for (int i = 0; i < spatial; ++i) {
        bottom_diff[block + c * spatial + i] -=
            cache_ratio * bottom_data[block + c * spatial + i] * accum_ratio_data[i];
      }
      cblas_saxpy(spatial, -1.0f, padded_ratio_data + padded_ratio.offset(0, c), 1,
                  accum_ratio_data, 1);
    }
  }
}

template <typename Dtype>
void LRNLayer<Dtype>::WithinChannelBackward(const std::vector<Blob<Dtype>*>& top,
                                            bool propagate_down,
                                            std::vector<Blob<Dtype>*>* bottom) {
  if (!propagate_down) {
    return;
  }
  // The product writes the bottom's direct gradient; the split then adds the
  // path through the squares.
  product_layer_->Backward(top, true, &product_bottom_vec_);
  power_layer_->Backward(power_top_vec_, true, &pool_top_vec_);
  pool_layer_->Backward(pool_top_vec_, true, &square_top_vec_);
  square_layer_->Backward(square_top_vec_, true, &square_bottom_vec_);
  split_layer_->Backward(split_top_vec_, true, bottom);
}

template class LRNLayer<float>;

}  // namespace nn
