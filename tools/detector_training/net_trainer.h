#ifndef TOOLS_DETECTOR_TRAINING_NET_TRAINER_H_
#define TOOLS_DETECTOR_TRAINING_NET_TRAINER_H_

#include <memory>
#include <random>
#include <string>
#include <vector>

#include "detector_training/window_set.h"
#include "nn/net.h"
#include "nn/proto/nn.pb.h"
#include "nn/sgd_solver.h"

namespace training {

struct NetTrainingSettings {
  int batch = 64;
  float baseLr = 0.01f;
  // The rate is multiplied by lrGamma every lrStepIterations.
  float lrGamma = 0.5f;
  int lrStepIterations = 10000;
  float momentum = 0.9f;
  float weightDecay = 5e-4f;
  // Loss weight of class 1 (faces) in a two-class net; moves the operating
  // point towards recall.
  float positiveWeight = 1.0f;
  unsigned seed = 1;
};

struct EpochFigures {
  double loss;
  double accuracy;
};

// Trains one net of the cascade on windows, with the engine's own forward
// and backward passes and its SGD solver.
//
// The training net is the deploy description without its softmax, at the
// batch size: the loss is a per-image softmax cross-entropy of its own
// (the deploy softmax normalises the first image of a batch only), plus a
// penalty on logits beyond +-kLogitBound that keeps the scan net's softmax,
// which subtracts one maximum per image, clear of exp underflow.
//
// Inputs are the window planes minus the mean. Convolutions fed by the input
// (directly or through average pooling) start at 1/64 of their usual scale,
// with learning-rate multiplier 1/4096 and decay multiplier 4096: exactly
// SGD on inputs scaled by 1/64, without changing what the deployed net sees.
//
// The scan net (scanNet) trains its first convolution without bias on the
// input minus 100; exported with bias -100 times the sum of its weights, it
// computes the same and its response to a constant image of 100 is zero, so
// that the primed net's correction vanishes at every pyramid size.
class NetTrainer {
 public:
  static constexpr float kLogitBound = 20.0f;

  NetTrainer(const std::string& deployText, int side, bool scanNet,
             const NetTrainingSettings& settings, std::vector<float> mean);

  // One pass over the set in a random order drawn from the seed and epoch;
  // a last partial batch is left out.
  EpochFigures trainEpoch(const WindowSet& set, int epoch);
  // The per-image softmax of every window, one row per window.
  std::vector<std::vector<float>> probabilities(const WindowSet& set);
  // The weight file of the deploy net.
  nn::NetParameter deployWeights() const;

  // Keeps the state after epochsDone epochs in folder; resume gives the
  // number of epochs of the newest snapshot there (0 if none) after loading it.
  void snapshot(const std::string& folder, int epochsDone) const;
  int resume(const std::string& folder);

 private:
  void fillInput(const WindowSet& set, const std::vector<size_t>& order, size_t first);
  // Writes the gradient of the loss into the logits' diff; returns the loss
  // and counts correct answers.
  double lossAndGradient(const WindowSet& set, const std::vector<size_t>& order, size_t first,
                         int* correct);

  NetTrainingSettings settings_;
  bool scanNet_;
  std::vector<float> mean_;
  std::unique_ptr<nn::Net<float>> net_;
  std::unique_ptr<nn::SGDSolver<float>> solver_;
};

// The training description: the deploy one without its final softmax, the
// input at batch by 3 by side by side, and the learning-rate and decay
// multipliers described for NetTrainer.
nn::NetParameter trainingDescription(const std::string& deployText, int batch, int side,
                                     bool scanNet);

// log(p / (1 - p)), in double.
double logOdds(float probability);

// Adds shift to the face logit (class 1) of a two-class net's weights, the
// bias of its last layer with weights: every face probability p becomes the
// one whose log-odds are those of p plus shift.
// Fatal if that layer is not an inner product or convolution with two outputs.
void raiseFaceLogit(nn::NetParameter& weights, double shift);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_NET_TRAINER_H_
