#ifndef TESTS_GRADIENT_CHECKER_H_
#define TESTS_GRADIENT_CHECKER_H_

#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <functional>
#include <memory>
#include <numeric>
#include <random>
#include <string>
#include <vector>

#include "nn/blob.h"
#include "nn/layer.h"

// Helpers of the engine's tests: messages from text, blob values, layers set
// up from their description, and finite-difference checks of gradients.
namespace nn {

using Blobs = std::vector<Blob<float>*>;

template <typename Proto>
Proto Parse(const std::string& text) {
  Proto proto;
  EXPECT_TRUE(google::protobuf::TextFormat::ParseFromString(text, &proto)) << text;
  return proto;
}

inline std::vector<float> Values(const Blob<float>& blob) {
  return {blob.cpu_data(), blob.cpu_data() + blob.count()};
}

inline std::vector<int> Shape(const Blob<float>& blob) {
  return {blob.num(), blob.channels(), blob.height(), blob.width()};
}

inline void SetValues(Blob<float>* blob, const std::vector<float>& values) {
  ASSERT_EQ(blob->count(), static_cast<int>(values.size()));
  std::copy(values.begin(), values.end(), blob->mutable_cpu_data());
}

// Uniform values in [low, high) from a fixed seed.
inline void FillUniform(Blob<float>* blob, float low, float high, unsigned seed = 1) {
  std::mt19937 generator(seed);
  std::uniform_real_distribution<float> draw(low, high);
  std::generate(blob->mutable_cpu_data(), blob->mutable_cpu_data() + blob->count(),
                [&] { return draw(generator); });
}

// The layer of a LayerParameter text, set up on one bottom and one top.
struct OneLayer {
  OneLayer(const std::string& text, Blob<float>* in)
      : bottom{in}, layer(GetLayer<float>(Parse<LayerParameter>(text))) {
    layer->SetUp(bottom, &top);
  }
  std::vector<float> Forward() {
    layer->Forward(bottom, &top);
    return Values(out);
  }
  Blob<float> out;
  Blobs bottom;
  Blobs top = {&out};
  std::unique_ptr<Layer<float>> layer;
};

// One forward pass of the layer of a LayerParameter text over a bottom of the
// given shape and values; the top's shape goes to top_shape if asked for.
inline std::vector<float> ForwardOn(const std::string& text, const std::vector<int>& shape,
                                    const std::vector<float>& values,
                                    std::vector<int>* top_shape = nullptr) {
  Blob<float> in(shape[0], shape[1], shape[2], shape[3]);
  SetValues(&in, values);
  OneLayer layer(text, &in);
  if (top_shape) {
    *top_shape = Shape(layer.out);
  }
  return layer.Forward();
}

// 0, 1, 2, ... n - 1.
inline std::vector<float> Ramp(int n) {
  std::vector<float> values(n);
  std::iota(values.begin(), values.end(), 0.0f);
  return values;
}

// Compares the derivatives left in the diffs of `blobs` with central
// differences of `objective` over their data.
inline void CheckDerivatives(const Blobs& blobs, const std::function<double()>& objective,
                             float step, float tolerance) {
  std::vector<std::vector<float>> analytic;
  for (Blob<float>* blob : blobs) {
    analytic.emplace_back(blob->cpu_diff(), blob->cpu_diff() + blob->count());
  }
  for (size_t b = 0; b < blobs.size(); ++b) {
    for (int k = 0; k < blobs[b]->count(); ++k) {
      float& x = blobs[b]->mutable_cpu_data()[k];
      const float original = x;
      x = original + step;
      const double plus = objective();
      x = original - step;
      const double numeric = (plus - objective()) / (2.0 * step);
      x = original;
      const double scale = std::max({1.0, std::fabs(numeric), std::fabs(double(analytic[b][k]))});
      ASSERT_NEAR(analytic[b][k], numeric, tolerance * scale) << "blob " << b << " element " << k;
    }
  }
}

// Checks a set-up layer's backward pass on the objective sum_i w_i * top_i,
// for fixed random weights w, over every bottom and parameter blob. A layer
// without tops (a loss) is checked on its loss, over its first bottom only:
// the second holds targets or labels.
inline void CheckGradient(Layer<float>* layer, const Blobs& bottom, Blobs* top, float step,
                          float tolerance = 1e-2f) {
  std::mt19937 generator(7);
  std::uniform_real_distribution<float> draw(-1.0f, 1.0f);
  layer->Forward(bottom, top);
  std::vector<std::vector<float>> weights;  // kept apart: a layer may share diffs
  for (Blob<float>* out : *top) {
    weights.emplace_back(out->count());
    std::generate(weights.back().begin(), weights.back().end(), [&] { return draw(generator); });
    std::copy(weights.back().begin(), weights.back().end(), out->mutable_cpu_diff());
  }
  Blobs checked(bottom.begin(), top->empty() ? bottom.begin() + 1 : bottom.end());
  for (const auto& param : layer->blobs()) {
    checked.push_back(param.get());
  }
  Blobs bottom_copy(bottom);
  layer->Backward(*top, true, &bottom_copy);
  CheckDerivatives(checked, [&] {
    double sum = layer->Forward(bottom, top);
    for (size_t t = 0; t < top->size(); ++t) {
      sum += std::inner_product(weights[t].begin(), weights[t].end(), (*top)[t]->cpu_data(), 0.0);
    }
    return sum;
  }, step, tolerance);
}

}  // namespace nn

#endif  // TESTS_GRADIENT_CHECKER_H_
