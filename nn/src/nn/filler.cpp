#include "nn/filler.h"

#include <glog/logging.h>

#include <cmath>

#include "nn/util/math_functions.h"

namespace nn {

namespace {

const char kNoSparsity[] = "Sparsity not supported by this Filler.";

}  // namespace

template <typename Dtype>
void ConstantFiller<Dtype>::Fill(Blob<Dtype>* blob) {
  Dtype* data = blob->mutable_cpu_data();
  const int count = blob->count();
  const Dtype value = this->filler_param_.value();
  CHECK(count);
  for (int i = 0; i < count; ++i) {
    data[i] = value;
  }
  CHECK_EQ(this->filler_param_.sparse(), -1) << kNoSparsity;
}

template <typename Dtype>
void UniformFiller<Dtype>::Fill(Blob<Dtype>* blob) {
  CHECK(blob->count());
  nn_rng_uniform(blob->count(), this->filler_param_.min(), this->filler_param_.max(),
                 blob->mutable_cpu_data());
  CHECK_EQ(this->filler_param_.sparse(), -1) << kNoSparsity;
}

template <typename Dtype>
void GaussianFiller<Dtype>::Fill(Blob<Dtype>* blob) {
  Dtype* data = blob->mutable_cpu_data();
  CHECK(blob->count());
  nn_rng_gaussian(blob->count(), this->filler_param_.mean(), this->filler_param_.std(), data);
  const int sparse = this->filler_param_.sparse();
  CHECK_GE(sparse, -1);
  if (sparse >= 0) {
    // Only a matrix has a number of inputs (its height) to spread over.
    CHECK_EQ(blob->num(), 1);
    CHECK_EQ(blob->channels(), 1);
    const int num_inputs = blob->height();
    const float non_zero_probability = static_cast<float>(sparse) / static_cast<float>(num_inputs);
    rand_vec_.reset(new SyncedMemory(blob->count() * sizeof(int)));
    int* mask = static_cast<int*>(rand_vec_->mutable_cpu_data());
    nn_rng_bernoulli(blob->count(), non_zero_probability, mask);
    for (int i = 0; i < blob->count(); ++i) {
      data[i] *= static_cast<Dtype>(mask[i]);
    }
  }
}

template <typename Dtype>
void PositiveUnitballFiller<Dtype>::Fill(Blob<Dtype>* blob) {
  Dtype* data = blob->mutable_cpu_data();
  nn_rng_uniform(blob->count(), 0, 1, data);
  const int num = blob->num();
  const int dim = blob->count() / num;
  CHECK(dim);
  for (int i = 0; i < num; ++i) {
    Dtype sum = 0;
    for (int j = 0; j < dim; ++j) {
      sum += data[i * dim + j];
    }
    for (int j = 0; j < dim; ++j) {
      data[i * dim + j] /= sum;
    }
  }
  CHECK_EQ(this->filler_param_.sparse(), -1) << kNoSparsity;
}

template <typename Dtype>
void XavierFiller<Dtype>::Fill(Blob<Dtype>* blob) {
  CHECK(blob->count());
  Dtype* data = blob->mutable_cpu_data();
  const int fan_in = blob->count() / blob->num();
  const Dtype scale = std::sqrt(Dtype(3) / fan_in);
  nn_rng_uniform(blob->count(), -scale, scale, data);
  CHECK_EQ(this->filler_param_.sparse(), -1) << kNoSparsity;
}

template <typename Dtype>
Filler<Dtype>* GetFiller(const FillerParameter& param) {
  const std::string& type = param.type();
  if (type == "constant") {
    return new ConstantFiller<Dtype>(param);
  } else if (type == "gaussian") {
    return new GaussianFiller<Dtype>(param);
  } else if (type == "positive_unitball") {
    return new PositiveUnitballFiller<Dtype>(param);
  } else if (type == "uniform") {
    return new UniformFiller<Dtype>(param);
  } else if (type == "xavier") {
    return new XavierFiller<Dtype>(param);
  }
  CHECK(false) << "Unknown filler name: " << type;
  return nullptr;
}

template class ConstantFiller<float>;
template class UniformFiller<float>;
template class GaussianFiller<float>;
template class PositiveUnitballFiller<float>;
template class XavierFiller<float>;
template Filler<float>* GetFiller<float>(const FillerParameter& param);

}  // namespace nn
