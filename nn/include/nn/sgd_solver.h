#ifndef NN_SGD_SOLVER_H_
#define NN_SGD_SOLVER_H_

#include <boost/shared_ptr.hpp>

#include <string>
#include <vector>

#include "nn/blob.h"
#include "nn/net.h"
#include "nn/proto/nn.pb.h"

namespace nn {

// Stochastic gradient descent with momentum and weight decay over the
// parameter blobs of one net, honouring the description's per-blob
// learning-rate and decay multipliers. The caller runs the forward and
// backward passes; ApplyUpdate turns the gradients they left into a step.
//
// Settings read from SolverParameter: base_lr, lr_policy ("fixed"; "step":
// base_lr * gamma ^ floor(iter / stepsize); "inv": base_lr * (1 + gamma *
// iter) ^ -power), momentum, weight_decay.
//
// Not thread-safe; it borrows the net, which must outlive it.
template <typename Dtype>
class SGDSolver {
 public:
  SGDSolver(const SolverParameter& param, Net<Dtype>* net);

  // One step from the gradients in the parameter diffs: for each blob,
  // v = momentum * v + rate * lr_mult * (grad + decay * decay_mult * w), then
  // w -= v. Counts the iteration.
  void ApplyUpdate();
  // The rate of the current iteration.
  Dtype LearningRate() const;
  int iter() const { return iter_; }

  // Writes the weights (binary weight-file form) and the solver state
  // (iteration, momentum, the weights' path), each under a temporary name
  // renamed when complete, so a snapshot is never half written.
  void Snapshot(const std::string& weights_file, const std::string& state_file) const;
  // Continues from a snapshot: weights, momentum and iteration. A file that
  // can't be read ends the process; a state of another net's shape too.
  void Restore(const std::string& state_file);

 private:
  SolverParameter param_;
  Net<Dtype>* net_;
  std::vector<boost::shared_ptr<Blob<Dtype>>> history_;
  int iter_ = 0;
};

}  // namespace nn

#endif  // NN_SGD_SOLVER_H_
