#include <glog/logging.h>

#include <algorithm>
#include <memory>

#include "nn/common_layers.h"
#include "nn/filler.h"
#include "nn/util/math_functions.h"

namespace nn {

template <typename Dtype>
void InnerProductLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                                     std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 1) << "IP Layer takes a single blob as input.";
  CHECK_EQ(top->size(), 1) << "IP Layer takes a single blob as output.";
  const InnerProductParameter& param = this->layer_param_.inner_product_param();
  bias_term_ = param.bias_term();
  M_ = bottom[0]->num();
  K_ = bottom[0]->count() / bottom[0]->num();
  N_ = param.num_output();
  (*top)[0]->Reshape(M_, N_, 1, 1);
  if (this->blobs_.empty()) {
    this->blobs_.resize(bias_term_ ? 2 : 1);
    this->blobs_[0].reset(new Blob<Dtype>(1, 1, N_, K_));
    std::unique_ptr<Filler<Dtype>> weight_filler(GetFiller<Dtype>(param.weight_filler()));
    weight_filler->Fill(this->blobs_[0].get());
    if (bias_term_) {
      this->blobs_[1].reset(new Blob<Dtype>(1, 1, 1, N_));
      std::unique_ptr<Filler<Dtype>> bias_filler(GetFiller<Dtype>(param.bias_filler()));
      bias_filler->Fill(this->blobs_[1].get());
    }
  }
  if (bias_term_) {
    bias_multiplier_.reset(new SyncedMemory(M_ * sizeof(Dtype)));
    Dtype* multiplier = static_cast<Dtype*>(bias_multiplier_->mutable_cpu_data());
    std::fill(multiplier, multiplier + M_, Dtype(1));
  }
}

template <typename Dtype>
Dtype InnerProductLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                            std::vector<Blob<Dtype>*>* top) {
  Dtype* top_data = (*top)[0]->mutable_cpu_data();
  cblas_sgemm(CblasRowMajor, CblasNoTrans, CblasTrans, M_, N_, K_, 1.0f, bottom[0]->cpu_data(), K_,
              this->blobs_[0]->cpu_data(), K_, 0.0f, top_data, N_);
  if (bias_term_) {
    // A column of ones times the bias, added: one exact bias * 1 per output,
    // so a loop gives the product's sums bit for bit, without its set-up cost.
    const Dtype* bias = this->blobs_[1]->cpu_data();
    for (int m = 0; m < M_; ++m) {
      for (int n = 0; n < N_; ++n) {
        top_data[m * N_ + n] += bias[n];
      }
    }
  }
  return Dtype(0);
}

template <typename Dtype>
void InnerProductLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top,
                                            bool propagate_down,
                                            std::vector<Blob<Dtype>*>* bottom) {
  const Dtype* top_diff = top[0]->cpu_diff();
  const Dtype* bottom_data = (*bottom)[0]->cpu_data();
  cblas_sgemm(CblasRowMajor, CblasTrans, CblasNoTrans, N_, K_, M_, 1.0f, top_diff, N_, bottom_data,
              K_, 0.0f, this->blobs_[0]->mutable_cpu_diff(), K_);
  if (bias_term_) {
    cblas_sgemv(CblasRowMajor, CblasTrans, M_, N_, 1.0f, top_diff, N_,
                static_cast<const Dtype*>(bias_multiplier_->cpu_data()), 1, 0.0f,
                this->blobs_[1]->mutable_cpu_diff(), 1);
  }
  if (propagate_down) {
    cblas_sgemm(CblasRowMajor, CblasNoTrans, CblasNoTrans, M_, K_, N_, 1.0f, top_diff, N_,
                this->blobs_[0]->cpu_data(), K_, 0.0f, (*bottom)[0]->mutable_cpu_diff(), K_);
  }
}

template class InnerProductLayer<float>;

}  // namespace nn
