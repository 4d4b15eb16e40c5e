#include "detector_training/net_trainer.h"

#include <glog/logging.h>

#include <algorithm>
#include <cmath>
#include <fstream>
#include <numeric>
#include <set>

#include "detector/image_planes.h"
#include "nn/util/io.h"
#include "nn/util/math_functions.h"

namespace training {

namespace {

// Inputs are pixel values minus a mean, spread about 64 either way.
constexpr float kInputScale = 64.0f;
// The constant image the scan net is primed with.
constexpr float kPrimingValue = 100.0f;

bool hasWeights(const nn::LayerParameter& layer) {
  return layer.type() == nn::LayerParameter::CONVOLUTION ||
         layer.type() == nn::LayerParameter::INNER_PRODUCT;
}

void setMultipliers(nn::LayerParameter* layer, float weightLr, float biasLr, float weightDecay) {
  layer->clear_blobs_lr();
  layer->clear_weight_decay();
  layer->add_blobs_lr(weightLr);
  layer->add_blobs_lr(biasLr);
  layer->add_weight_decay(weightDecay);
  layer->add_weight_decay(0.0f);
}

std::string snapshotName(const std::string& folder, int epochs, const char* kind) {
  return folder + "/epoch-" + std::to_string(epochs) + "." + kind;
}

}  // namespace

nn::NetParameter trainingDescription(const std::string& deployText, int batch, int side,
                                     bool scanNet) {
  nn::NetParameter param;
  nn::ReadNetParamsFromText(deployText, &param);
  CHECK(param.layers_size() > 0 &&
        param.layers(param.layers_size() - 1).type() == nn::LayerParameter::SOFTMAX)
      << "A cascade net ends in its softmax.";
  param.mutable_layers()->RemoveLast();
  param.clear_input_dim();
  for (int dim : {batch, 3, side, side}) {
    param.add_input_dim(dim);
  }
  // Blobs that are the input or average pools of it: linear in the pixels.
  std::set<std::string> inputLike{param.input(0)};
  bool firstConvolution = true;
  for (nn::LayerParameter& layer : *param.mutable_layers()) {
    const bool fromInput = layer.bottom_size() == 1 && inputLike.count(layer.bottom(0)) > 0;
    if (layer.type() == nn::LayerParameter::POOLING && fromInput &&
        layer.pooling_param().pool() == nn::PoolingParameter::AVE) {
      inputLike.insert(layer.top(0));
    }
    if (!hasWeights(layer)) {
      continue;
    }
    const float scaleSquared = kInputScale * kInputScale;
    if (layer.type() == nn::LayerParameter::CONVOLUTION && fromInput) {
      const bool fixedBias = scanNet && firstConvolution;
      setMultipliers(&layer, 1.0f / scaleSquared, fixedBias ? 0.0f : 1.0f, scaleSquared);
    } else {
      setMultipliers(&layer, 1.0f, 1.0f, 1.0f);
    }
    firstConvolution = firstConvolution && layer.type() != nn::LayerParameter::CONVOLUTION;
  }
  return param;
}

NetTrainer::NetTrainer(const std::string& deployText, int side, bool scanNet,
                       const NetTrainingSettings& settings, std::vector<float> mean)
    : settings_(settings), scanNet_(scanNet), mean_(std::move(mean)) {
  const nn::NetParameter description = trainingDescription(deployText, settings.batch, side, scanNet);
  net_.reset(new nn::Net<float>(description));
  CHECK_EQ(net_->output_blobs().size(), 1u) << "A cascade net has one output.";
  CHECK_EQ(static_cast<int>(mean_.size()), net_->net_input_blobs()[0]->count() / settings.batch)
      << "The mean has the size of one input image.";
  // He initialisation, the input-fed convolutions scaled down (see the
  // class comment) and the last layer at unit gain; biases start at 0.
  std::mt19937 random(settings.seed);
  const auto& layers = net_->layers();
  int lastWeighted = -1;
  for (size_t i = 0; i < layers.size(); ++i) {
    if (!layers[i]->blobs().empty()) {
      lastWeighted = static_cast<int>(i);
    }
  }
  for (size_t i = 0; i < layers.size(); ++i) {
    auto& blobs = layers[i]->blobs();
    if (blobs.empty()) {
      continue;
    }
    nn::Blob<float>& weights = *blobs[0];
    const bool convolution = layers[i]->layer_param().type() == nn::LayerParameter::CONVOLUTION;
    const int fanIn = weights.count() / (convolution ? weights.num() : weights.height());
    float std = std::sqrt((static_cast<int>(i) == lastWeighted ? 1.0f : 2.0f) / fanIn);
    if (layers[i]->layer_param().blobs_lr(0) < 1.0f) {
      std /= kInputScale;
    }
    std::normal_distribution<float> draw(0.0f, std);
    float* data = weights.mutable_cpu_data();
    for (int k = 0; k < weights.count(); ++k) {
      data[k] = draw(random);
    }
    if (blobs.size() > 1) {
      std::fill_n(blobs[1]->mutable_cpu_data(), blobs[1]->count(), 0.0f);
    }
  }
  nn::SolverParameter solver;
  solver.set_base_lr(settings.baseLr);
  solver.set_lr_policy("step");
  solver.set_gamma(settings.lrGamma);
  solver.set_stepsize(settings.lrStepIterations);
  solver.set_momentum(settings.momentum);
  solver.set_weight_decay(settings.weightDecay);
  solver_.reset(new nn::SGDSolver<float>(solver, net_.get()));
}

void NetTrainer::fillInput(const WindowSet& set, const std::vector<size_t>& order, size_t first) {
  nn::Blob<float>& input = *net_->net_input_blobs()[0];
  const int perImage = input.count() / input.num();
  float* data = input.mutable_cpu_data();
  for (int i = 0; i < input.num(); ++i) {
    float* planes = data + i * perImage;
    tavilib::writeImagePlanes(set.windows[order[first + i]], planes, perImage);
    nn::vsSub(perImage, planes, mean_.data(), planes);
  }
}

double NetTrainer::lossAndGradient(const WindowSet& set, const std::vector<size_t>& order,
                                   size_t first, int* correct) {
  nn::Blob<float>& logits = *net_->output_blobs()[0];
  const int batch = logits.num();
  const int classes = logits.count() / batch;
  const float* z = logits.cpu_data();
  float* gradient = logits.mutable_cpu_diff();
  double loss = 0.0;
  const float penalty = 1.0f / static_cast<float>(batch);
  for (int i = 0; i < batch; ++i) {
    const int label = set.labels[order[first + i]];
    const float* row = z + i * classes;
    float* rowGradient = gradient + i * classes;
    const float largest = *std::max_element(row, row + classes);
    double sum = 0.0;
    for (int k = 0; k < classes; ++k) {
      sum += std::exp(static_cast<double>(row[k] - largest));
    }
    const float weight = (classes == 2 && label == 1) ? settings_.positiveWeight : 1.0f;
    for (int k = 0; k < classes; ++k) {
      const double probability = std::exp(static_cast<double>(row[k] - largest)) / sum;
      rowGradient[k] =
          weight * static_cast<float>(probability - (k == label ? 1.0 : 0.0)) / batch;
      const float excess = std::fabs(row[k]) - kLogitBound;
      if (excess > 0.0f) {
        loss += penalty * excess * excess;
        rowGradient[k] += penalty * 2.0f * excess * (row[k] > 0.0f ? 1.0f : -1.0f);
      }
    }
    const double labelProbability = std::exp(static_cast<double>(row[label] - largest)) / sum;
    loss += weight * -std::log(std::max(labelProbability, 1e-30)) / batch;
    *correct += static_cast<int>(std::max_element(row, row + classes) - row) == label;
  }
  return loss;
}

EpochFigures NetTrainer::trainEpoch(const WindowSet& set, int epoch) {
  std::vector<size_t> order(set.size());
  std::iota(order.begin(), order.end(), 0);
  std::mt19937 random(settings_.seed * 7919u + static_cast<unsigned>(epoch));
  std::shuffle(order.begin(), order.end(), random);
  const size_t batch = static_cast<size_t>(settings_.batch);
  double loss = 0.0;
  int correct = 0;
  size_t batches = 0;
  for (size_t first = 0; first + batch <= order.size(); first += batch, ++batches) {
    fillInput(set, order, first);
    net_->Forward();
    loss += lossAndGradient(set, order, first, &correct);
    net_->Backward();
    solver_->ApplyUpdate();
  }
  const double seen = static_cast<double>(std::max<size_t>(batches * batch, 1));
  return {loss / std::max<double>(static_cast<double>(batches), 1.0), correct / seen};
}

std::vector<std::vector<float>> NetTrainer::probabilities(const WindowSet& set) {
  const size_t batch = static_cast<size_t>(settings_.batch);
  std::vector<std::vector<float>> result;
  std::vector<size_t> order(set.size());
  std::iota(order.begin(), order.end(), 0);
  // The last batch is padded with the first windows and cut back after.
  while (order.size() % batch != 0) {
    order.push_back(order.size() % set.size());
  }
  for (size_t first = 0; first < order.size(); first += batch) {
    fillInput(set, order, first);
    const nn::Blob<float>& logits = *net_->Forward()[0];
    const int classes = logits.count() / logits.num();
    for (size_t i = 0; i < batch && result.size() < set.size(); ++i) {
      const float* row = logits.cpu_data() + i * classes;
      const float largest = *std::max_element(row, row + classes);
      std::vector<float> probability(classes);
      double sum = 0.0;
      for (int k = 0; k < classes; ++k) {
        sum += std::exp(static_cast<double>(row[k] - largest));
      }
      for (int k = 0; k < classes; ++k) {
        probability[k] = static_cast<float>(std::exp(static_cast<double>(row[k] - largest)) / sum);
      }
      result.push_back(std::move(probability));
    }
  }
  return result;
}

nn::NetParameter NetTrainer::deployWeights() const {
  nn::NetParameter weights;
  net_->ToProto(&weights);
  if (scanNet_) {
    // The first convolution learnt without bias on the input minus 100:
    // W (x - 100) is W x plus a bias of -100 times the sum of W.
    nn::LayerParameter& first = *weights.mutable_layers(0);
    CHECK_EQ(first.type(), nn::LayerParameter::CONVOLUTION) << "The scan net starts with its convolution.";
    const nn::BlobProto& kernel = first.blobs(0);
    nn::BlobProto& bias = *first.mutable_blobs(1);
    const int outputs = bias.data_size();
    const int perOutput = kernel.data_size() / outputs;
    for (int c = 0; c < outputs; ++c) {
      double sum = 0.0;
      for (int k = 0; k < perOutput; ++k) {
        sum += kernel.data(c * perOutput + k);
      }
      bias.set_data(c, static_cast<float>(-kPrimingValue * sum));
    }
  }
  return weights;
}

double logOdds(float probability) {
  const double p = probability;
  return std::log(p / (1.0 - p));
}

void raiseFaceLogit(nn::NetParameter& weights, double shift) {
  CHECK_GT(weights.layers_size(), 0) << "No layers to shift.";
  int last = weights.layers_size() - 1;
  while (last > 0 && weights.layers(last).blobs_size() == 0) {
    --last;
  }
  nn::LayerParameter& layer = *weights.mutable_layers(last);
  // A grader ends in an inner product, the scan net in a convolution that
  // gives the two logits of every cell.
  CHECK((layer.type() == nn::LayerParameter::INNER_PRODUCT ||
         layer.type() == nn::LayerParameter::CONVOLUTION) &&
        layer.blobs_size() == 2 && layer.blobs(1).data_size() == 2)
      << "The face logit is the second output of a two-class inner product or convolution.";
  nn::BlobProto& bias = *layer.mutable_blobs(1);
  bias.set_data(1, static_cast<float>(bias.data(1) + shift));
}

void NetTrainer::snapshot(const std::string& folder, int epochsDone) const {
  solver_->Snapshot(snapshotName(folder, epochsDone, "weights"),
                    snapshotName(folder, epochsDone, "state"));
}

int NetTrainer::resume(const std::string& folder) {
  for (int epochs = 1000; epochs > 0; --epochs) {
    const std::string state = snapshotName(folder, epochs, "state");
    if (std::ifstream(state).good()) {
      solver_->Restore(state);
      return epochs;
    }
  }
  return 0;
}

}  // namespace training
