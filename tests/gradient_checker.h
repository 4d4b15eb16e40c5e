#ifndef TESTS_GRADIENT_CHECKER_H_
#define TESTS_GRADIENT_CHECKER_H_

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <random>
#include <vector>

#include "nn/blob.h"
#include "nn/layer.h"

namespace nn {

// Fills a blob with uniform values in [low, high) from a fixed seed.
inline void FillUniform(Blob<float>* blob, float low, float high, unsigned seed = 1) {
  std::mt19937 generator(seed);
  std::uniform_real_distribution<float> draw(low, high);
  float* data = blob->mutable_cpu_data();
  for (int i = 0; i < blob->count(); ++i) {
    data[i] = draw(generator);
  }
}

// Compares a layer's backward pass with central finite differences of the
// objective sum_i w_i * top_i, for fixed random weights w. Checks the
// gradients of every bottom and of every parameter blob.
class GradientChecker {
 public:
  GradientChecker(float step, float tolerance) : step_(step), tolerance_(tolerance) {}

  void Check(Layer<float>* layer, const std::vector<Blob<float>*>& bottom,
             std::vector<Blob<float>*>* top) {
    layer->Forward(bottom, top);
    std::vector<std::vector<float>> weights;
    std::mt19937 generator(7);
    std::uniform_real_distribution<float> draw(-1.0f, 1.0f);
    for (Blob<float>* out : *top) {
      weights.emplace_back(out->count());
      for (float& w : weights.back()) {
        w = draw(generator);
      }
      std::copy(weights.back().begin(), weights.back().end(), out->mutable_cpu_diff());
    }
    std::vector<Blob<float>*> checked(bottom.begin(), bottom.end());
    for (const auto& param : layer->blobs()) {
      checked.push_back(param.get());
    }
    std::vector<Blob<float>*> bottom_copy(bottom);
    layer->Backward(*top, true, &bottom_copy);
    std::vector<std::vector<float>> analytic;
    for (Blob<float>* blob : checked) {
      analytic.emplace_back(blob->cpu_diff(), blob->cpu_diff() + blob->count());
    }

    for (size_t b = 0; b < checked.size(); ++b) {
      float* data = checked[b]->mutable_cpu_data();
      for (int k = 0; k < checked[b]->count(); ++k) {
        const float original = data[k];
        data[k] = original + step_;
        const double plus = Objective(layer, bottom, top, weights);
        data[k] = original - step_;
        const double minus = Objective(layer, bottom, top, weights);
        data[k] = original;
        const double numeric = (plus - minus) / (2.0 * step_);
        const double scale = std::max({1.0, std::fabs(numeric), std::fabs(double(analytic[b][k]))});
        EXPECT_NEAR(analytic[b][k], numeric, tolerance_ * scale)
            << "blob " << b << " element " << k;
      }
    }
  }

 private:
  static double Objective(Layer<float>* layer, const std::vector<Blob<float>*>& bottom,
                          std::vector<Blob<float>*>* top,
                          const std::vector<std::vector<float>>& weights) {
    layer->Forward(bottom, top);
    double sum = 0;
    for (size_t t = 0; t < top->size(); ++t) {
      const float* data = (*top)[t]->cpu_data();
      for (int i = 0; i < (*top)[t]->count(); ++i) {
        sum += double(weights[t][i]) * data[i];
      }
    }
    return sum;
  }

  float step_;
  float tolerance_;
};

}  // namespace nn

#endif  // TESTS_GRADIENT_CHECKER_H_
