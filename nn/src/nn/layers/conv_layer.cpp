#include <glog/logging.h>

#include <algorithm>
#include <memory>

#include "nn/filler.h"
#include "nn/util/math_functions.h"
#include "nn/vision_layers.h"

namespace nn {

namespace {

int ConvOutputSize(int size, int kernel_size, int pad, int stride) {
  return (size + 2 * pad - kernel_size) / stride + 1;
}

// Output rows unfolded at a time. Columns that fit in the last-level cache
// go in one product (smaller ones lose more to the product's set-up than they
// gain); larger ones in bands of about 1 MB, the second-level cache, so that
// the product reads what was just unfolded from the cache, not from memory.
int BandRows(int width_out, int height_out, int column_rows) {
  constexpr long kWholeFloats = 1L << 20;
  constexpr long kBandFloats = 1L << 18;
  const long per_row = std::max(1L, static_cast<long>(width_out) * column_rows);
  if (per_row * height_out <= kWholeFloats) {
    return std::max(1, height_out);
  }
  return static_cast<int>(std::max(1L, std::min<long>(height_out, kBandFloats / per_row)));
}

}  // namespace

template <typename Dtype>
void BinaryConvolver<Dtype>::Convolve(Dtype*) {
  LOG(FATAL) << "Binarized convolution is not available.";
}

template <typename Dtype>
void ConvolutionLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                                    std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 1) << "Conv Layer takes a single blob as input.";
  CHECK_EQ(top->size(), 1) << "Conv Layer takes a single blob as output.";
  const ConvolutionParameter& param = this->layer_param_.convolution_param();
  kernel_size_ = param.kernel_size();
  stride_ = param.stride();
  group_ = param.group();
  pad_ = param.pad();
  num_ = bottom[0]->num();
  channels_ = bottom[0]->channels();
  height_ = bottom[0]->height();
  width_ = bottom[0]->width();
  num_output_ = param.num_output();
  CHECK_GT(num_output_, 0);
  CHECK_EQ(channels_ % group_, 0);
  const int height_out = ConvOutputSize(height_, kernel_size_, pad_, stride_);
  const int width_out = ConvOutputSize(width_, kernel_size_, pad_, stride_);
  col_buffer_.Reshape(1, channels_ * kernel_size_ * kernel_size_, height_out, width_out);
  CHECK_EQ(num_output_ % group_, 0) << "Number of output should be multiples of group.";
  bias_term_ = param.bias_term();
  M_ = num_output_ / group_;
  K_ = channels_ * kernel_size_ * kernel_size_ / group_;
  N_ = height_out * width_out;
  (*top)[0]->Reshape(bottom[0]->num(), num_output_, height_out, width_out);

  if (this->blobs_.empty()) {
    this->blobs_.resize(bias_term_ ? 2 : 1);
    this->blobs_[0].reset(
        new Blob<Dtype>(num_output_, channels_ / group_, kernel_size_, kernel_size_));
    std::unique_ptr<Filler<Dtype>> weight_filler(GetFiller<Dtype>(param.weight_filler()));
    weight_filler->Fill(this->blobs_[0].get());
    if (bias_term_) {
      this->blobs_[1].reset(new Blob<Dtype>(1, 1, 1, num_output_));
      std::unique_ptr<Filler<Dtype>> bias_filler(GetFiller<Dtype>(param.bias_filler()));
      bias_filler->Fill(this->blobs_[1].get());
    }
  }
  if (bias_term_) {
    bias_multiplier_.reset(new SyncedMemory(N_ * sizeof(Dtype)));
    Dtype* multiplier = static_cast<Dtype*>(bias_multiplier_->mutable_cpu_data());
    for (int i = 0; i < N_; ++i) {
      multiplier[i] = Dtype(1);
    }
  }
}

template <typename Dtype>
void ConvolutionLayer<Dtype>::UpdateOffsets() {
  weight_offset_ = M_ * K_;
  col_offset_ = K_ * N_;
  top_offset_ = M_ * N_;
}

template <typename Dtype>
void ConvolutionLayer<Dtype>::AlterInputShape(int, int, const std::vector<Blob<Dtype>*>& bottom,
                                              std::vector<Blob<Dtype>*>* top) {
  height_ = bottom[0]->height();
  width_ = bottom[0]->width();
  const int height_out = ConvOutputSize(height_, kernel_size_, pad_, stride_);
  const int width_out = ConvOutputSize(width_, kernel_size_, pad_, stride_);
  N_ = height_out * width_out;
  (*top)[0]->RewriteShape(bottom[0]->num(), num_output_, height_out, width_out);
  UpdateOffsets();
}

template <typename Dtype>
void ConvolutionLayer<Dtype>::AddBias(Dtype* top_image) {
  // The outer product of the bias with a row of ones, added: each output
  // gains bias * 1 exactly once, so a plain loop gives the product's sums
  // bit for bit without its set-up cost, which outweighs the work on small maps.
  const Dtype* bias = this->blobs_[1]->cpu_data();
  for (int o = 0; o < num_output_; ++o) {
    Dtype* row = top_image + o * N_;
    for (int i = 0; i < N_; ++i) {
      row[i] += bias[o];
    }
  }
}

template <typename Dtype>
Dtype ConvolutionLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                           std::vector<Blob<Dtype>*>* top) {
  const Dtype* bottom_data = bottom[0]->cpu_data();
  Dtype* top_data = (*top)[0]->mutable_cpu_data();
  Dtype* col_data = col_buffer_.mutable_cpu_data();
  const Dtype* weight = this->blobs_[0]->cpu_data();
  const int width_out = (*top)[0]->width();
  const int height_out = (*top)[0]->height();
  // A 1x1 kernel without stride or padding unfolds an image into itself: the
  // product reads the image, in one band.
  const bool unfolded = kernel_size_ == 1 && stride_ == 1 && pad_ == 0;
  const int rows_per_band = unfolded ? height_out : BandRows(width_out, height_out, K_ * group_);
  for (int n = 0; n < num_; ++n) {
    const Dtype* bottom_image = bottom_data + bottom[0]->offset(n);
    Dtype* top_image = top_data + (*top)[0]->offset(n);
    // Band by band of output rows, so that the unfolded columns are still in
    // the cache when the product reads them; each output is the same sum.
    for (int row = 0; row < height_out; row += rows_per_band) {
      const int rows = std::min(rows_per_band, height_out - row);
      const int band = rows * width_out;
      // Before weights or a new size arrive, every group reads the first
      // group's slices, as the offsets (still 0) say.
      const int band_col_offset = col_offset_ == 0 ? 0 : K_ * band;
      const Dtype* columns = unfolded ? bottom_image : col_data;
      if (!unfolded) {
        im2col_rows(bottom_image, channels_, height_, width_, kernel_size_, pad_, stride_, row,
                    row + rows, col_data);
      }
      for (int g = 0; g < group_; ++g) {
        cblas_sgemm(CblasRowMajor, CblasNoTrans, CblasNoTrans, M_, band, K_, 1.0f,
                    weight + weight_offset_ * g, K_, columns + band_col_offset * g, band, 0.0f,
                    top_image + top_offset_ * g + row * width_out, N_);
      }
    }
    if (bias_term_) {
      AddBias(top_image);
    }
  }
  return Dtype(0);
}

template <typename Dtype>
void ConvolutionLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top,
                                           bool propagate_down,
                                           std::vector<Blob<Dtype>*>* bottom) {
  const Dtype* top_diff = top[0]->cpu_diff();
  const Dtype* weight = this->blobs_[0]->cpu_data();
  Dtype* weight_diff = this->blobs_[0]->mutable_cpu_diff();
  const Dtype* bottom_data = (*bottom)[0]->cpu_data();
  Dtype* bottom_diff = propagate_down ? (*bottom)[0]->mutable_cpu_diff() : nullptr;
  Dtype* col_data = col_buffer_.mutable_cpu_data();
  // The column buffer's gradient reuses its diff array.
  Dtype* col_diff = col_buffer_.mutable_cpu_diff();

  std::fill(weight_diff, weight_diff + this->blobs_[0]->count(), Dtype(0));
  if (bias_term_) {
    Dtype* bias_diff = this->blobs_[1]->mutable_cpu_diff();
    std::fill(bias_diff, bias_diff + this->blobs_[1]->count(), Dtype(0));
    const Dtype* multiplier = static_cast<const Dtype*>(bias_multiplier_->cpu_data());
    for (int n = 0; n < num_; ++n) {
      cblas_sgemv(CblasRowMajor, CblasNoTrans, num_output_, N_, 1.0f,
                  top_diff + top[0]->offset(n), N_, multiplier, 1, 1.0f, bias_diff, 1);
    }
  }
  for (int n = 0; n < num_; ++n) {
    im2col(bottom_data + (*bottom)[0]->offset(n), channels_, height_, width_, kernel_size_, pad_,
           stride_, col_data);
    const Dtype* top_image_diff = top_diff + top[0]->offset(n);
    for (int g = 0; g < group_; ++g) {
      cblas_sgemm(CblasRowMajor, CblasNoTrans, CblasTrans, M_, K_, N_, 1.0f,
                  top_image_diff + top_offset_ * g, N_, col_data + col_offset_ * g, N_, 1.0f,
                  weight_diff + weight_offset_ * g, K_);
    }
    if (propagate_down) {
      for (int g = 0; g < group_; ++g) {
        cblas_sgemm(CblasRowMajor, CblasTrans, CblasNoTrans, K_, N_, M_, 1.0f,
                    weight + weight_offset_ * g, K_, top_image_diff + top_offset_ * g, N_, 0.0f,
                    col_diff + col_offset_ * g, N_);
      }
      col2im(col_diff, channels_, height_, width_, kernel_size_, pad_, stride_,
             bottom_diff + (*bottom)[0]->offset(n));
    }
  }
}

template <typename Dtype>
Dtype ConvolutionLayer<Dtype>::Forward_binarized(const std::vector<Blob<Dtype>*>&,
                                                 std::vector<Blob<Dtype>*>* top) {
  CHECK(binarizer_) << "Binarized convolution is not available.";
  Dtype* top_data = (*top)[0]->mutable_cpu_data();
  for (int n = 0; n < num_; ++n) {
    binarizer_->Convolve(top_data + (*top)[0]->offset(n));
    if (bias_term_) {
      AddBias(top_data + (*top)[0]->offset(n));
    }
  }
  return Dtype(0);
}

template <typename Dtype>
void ConvolutionLayer<Dtype>::CheckBinarization() {
  CHECK_EQ(group_, 1) << "binarization supports only single group.";
}

template class BinaryConvolver<float>;
template class ConvolutionLayer<float>;

}  // namespace nn
