#include <boost/math/special_functions/next.hpp>
#include <boost/random/bernoulli_distribution.hpp>
#include <boost/random/normal_distribution.hpp>
#include <boost/random/uniform_real.hpp>
#include <boost/random/variate_generator.hpp>
#include <glog/logging.h>

#include <limits>

#include "nn/engine.h"
#include "nn/util/math_functions.h"

namespace nn {

namespace {

template <typename Distribution, typename Output>
void Draw(int n, Distribution distribution, Output* r) {
  boost::variate_generator<boost::mt19937&, Distribution> draw(Engine::rng_engine(),
                                                               distribution);
  for (int i = 0; i < n; ++i) {
    r[i] = draw();
  }
}

template <typename Probability>
void DrawBernoulli(int n, Probability p, int* r) {
  CHECK_GE(n, 0);
  CHECK(r);
  CHECK_GE(p, 0);
  CHECK_LE(p, 1);
  Draw(n, boost::bernoulli_distribution<Probability>(p), r);
}

}  // namespace

void nn_rng_uniform(int n, float a, float b, float* r) {
  CHECK_GE(n, 0);
  CHECK(r);
  CHECK_LE(a, b);
  // One float further up, so that b itself can be drawn.
  const float upper = boost::math::nextafter(b, std::numeric_limits<float>::max());
  Draw(n, boost::uniform_real<float>(a, upper), r);
}

void nn_rng_gaussian(int n, float mu, float sigma, float* r) {
  CHECK_GE(n, 0);
  CHECK(r);
  CHECK_GT(sigma, 0);
  Draw(n, boost::normal_distribution<float>(mu, sigma), r);
}

void nn_rng_bernoulli(int n, double p, int* r) { DrawBernoulli(n, p, r); }

void nn_rng_bernoulli(int n, float p, int* r) { DrawBernoulli(n, p, r); }

}  // namespace nn
