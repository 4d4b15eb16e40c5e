#ifndef NN_FILLER_H_
#define NN_FILLER_H_

#include <boost/shared_ptr.hpp>

#include "nn/blob.h"
#include "nn/proto/nn.pb.h"
#include "nn/syncedmem.h"

namespace nn {

// Gives a new parameter blob its first values, as a layer's description asks.
// Draws come from the engine's generator (not thread-safe).
template <typename Dtype>
class Filler {
 public:
  explicit Filler(const FillerParameter& param) : filler_param_(param) {}
  virtual ~Filler() = default;
  virtual void Fill(Blob<Dtype>* blob) = 0;

 protected:
  FillerParameter filler_param_;
};

// Every element is `value`.
template <typename Dtype>
class ConstantFiller : public Filler<Dtype> {
 public:
  explicit ConstantFiller(const FillerParameter& param) : Filler<Dtype>(param) {}
  void Fill(Blob<Dtype>* blob) override;
};

// Uniform in [min, max].
template <typename Dtype>
class UniformFiller : public Filler<Dtype> {
 public:
  explicit UniformFiller(const FillerParameter& param) : Filler<Dtype>(param) {}
  void Fill(Blob<Dtype>* blob) override;
};

// Normal with `mean` and `std`; with `sparse` k >= 0 each weight of a
// (1, 1, inputs, outputs) matrix survives with probability k / inputs.
template <typename Dtype>
class GaussianFiller : public Filler<Dtype> {
 public:
  explicit GaussianFiller(const FillerParameter& param) : Filler<Dtype>(param) {}
  void Fill(Blob<Dtype>* blob) override;

 protected:
  boost::shared_ptr<SyncedMemory> rand_vec_;
};

// Uniform in [0, 1], then each of the num rows divided by its sum.
template <typename Dtype>
class PositiveUnitballFiller : public Filler<Dtype> {
 public:
  explicit PositiveUnitballFiller(const FillerParameter& param) : Filler<Dtype>(param) {}
  void Fill(Blob<Dtype>* blob) override;
};

// Uniform in +-sqrt(3 / fan_in), fan_in being count / num.
template <typename Dtype>
class XavierFiller : public Filler<Dtype> {
 public:
  explicit XavierFiller(const FillerParameter& param) : Filler<Dtype>(param) {}
  void Fill(Blob<Dtype>* blob) override;
};

// A new filler of param.type, owned by the caller; an unknown type is fatal.
template <typename Dtype>
Filler<Dtype>* GetFiller(const FillerParameter& param);

}  // namespace nn

#endif  // NN_FILLER_H_
