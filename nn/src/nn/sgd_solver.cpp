#include "nn/sgd_solver.h"

#include <glog/logging.h>

#include <algorithm>
#include <cmath>
#include <cstdio>

#include "nn/util/io.h"
#include "nn/util/math_functions.h"

namespace nn {

template <typename Dtype>
SGDSolver<Dtype>::SGDSolver(const SolverParameter& param, Net<Dtype>* net)
    : param_(param), net_(net) {
  CHECK(param_.lr_policy() == "fixed" || param_.lr_policy() == "step" ||
        param_.lr_policy() == "inv")
      << "Unknown learning rate policy: " << param_.lr_policy();
  CHECK(param_.lr_policy() != "step" || param_.stepsize() > 0)
      << "The step policy needs a positive stepsize.";
  for (const auto& blob : net_->params()) {
    history_.emplace_back(
        new Blob<Dtype>(blob->num(), blob->channels(), blob->height(), blob->width()));
    std::fill_n(history_.back()->mutable_cpu_data(), blob->count(), Dtype(0));
  }
}

template <typename Dtype>
Dtype SGDSolver<Dtype>::LearningRate() const {
  const double base = param_.base_lr();
  if (param_.lr_policy() == "step") {
    return static_cast<Dtype>(base * std::pow(param_.gamma(), iter_ / param_.stepsize()));
  }
  if (param_.lr_policy() == "inv") {
    return static_cast<Dtype>(base * std::pow(1.0 + param_.gamma() * iter_, -param_.power()));
  }
  return static_cast<Dtype>(base);
}

template <typename Dtype>
void SGDSolver<Dtype>::ApplyUpdate() {
  const Dtype rate = LearningRate();
  const auto& params = net_->params();
  for (size_t i = 0; i < params.size(); ++i) {
    Blob<Dtype>& blob = *params[i];
    const int count = blob.count();
    const Dtype local_rate = rate * net_->params_lr()[i];
    const Dtype local_decay = param_.weight_decay() * net_->params_weight_decay()[i];
    Dtype* diff = blob.mutable_cpu_diff();
    if (local_decay != 0) {
      cblas_saxpy(count, local_decay, blob.cpu_data(), 1, diff, 1);
    }
    Dtype* velocity = history_[i]->mutable_cpu_data();
    cblas_saxpby(count, local_rate, diff, 1, param_.momentum(), velocity, 1);
    cblas_saxpy(count, Dtype(-1), velocity, 1, blob.mutable_cpu_data(), 1);
  }
  ++iter_;
}

namespace {

void WriteOrDie(const Message& message, const std::string& path) {
  const std::string temporary = path + ".tmp";
  CHECK(WriteProtoToBinaryFile(message, temporary)) << "Cannot write " << temporary;
  CHECK_EQ(std::rename(temporary.c_str(), path.c_str()), 0) << "Cannot rename to " << path;
}

}  // namespace

template <typename Dtype>
void SGDSolver<Dtype>::Snapshot(const std::string& weights_file,
                                const std::string& state_file) const {
  NetParameter weights;
  net_->ToProto(&weights);
  WriteOrDie(weights, weights_file);
  SolverState state;
  state.set_iter(iter_);
  state.set_learned_net(weights_file);
  for (const auto& blob : history_) {
    blob->ToProto(state.add_history());
  }
  WriteOrDie(state, state_file);
}

template <typename Dtype>
void SGDSolver<Dtype>::Restore(const std::string& state_file) {
  SolverState state;
  ReadProtoFromBinaryFileOrDie(state_file.c_str(), &state);
  CHECK_EQ(static_cast<size_t>(state.history_size()), history_.size())
      << "The solver state " << state_file << " belongs to another net.";
  net_->CopyTrainedLayersFrom(state.learned_net());
  for (size_t i = 0; i < history_.size(); ++i) {
    CHECK_EQ(state.history(i).num() * state.history(i).channels() * state.history(i).height() *
                 state.history(i).width(),
             history_[i]->count())
        << "The solver state " << state_file << " belongs to another net.";
    history_[i]->FromProto(state.history(i));
  }
  iter_ = state.iter();
}

template class SGDSolver<float>;

}  // namespace nn
