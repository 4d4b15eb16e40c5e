#include "nn/util/math_functions.h"

#include <glog/logging.h>

#include <cmath>

namespace nn {

namespace {

// The vector routines report bad arguments and go on, as a vector-math
// library does; the engine never provokes this.
bool ArgumentsValid(const char* routine, int n, const float* a, const float* b, const float* y) {
  if (n < 0) {
    LOG(ERROR) << "Parameter 1 was incorrect on entry to " << routine << ".";
    return false;
  }
  if (n > 0 && (a == nullptr || b == nullptr || y == nullptr)) {
    LOG(ERROR) << "A null array was passed to " << routine << ".";
    return false;
  }
  return true;
}

}  // namespace

void cblas_saxpby(int n, float alpha, const float* x, int incx, float beta, float* y, int incy) {
  for (int i = 0; i < n; ++i) {
    y[i * incy] = alpha * x[i * incx] + beta * y[i * incy];
  }
}

void vsAdd(int n, const float* a, const float* b, float* y) {
  if (ArgumentsValid("vsAdd", n, a, b, y)) {
    for (int i = 0; i < n; ++i) {
      y[i] = a[i] + b[i];
    }
  }
}

void vsSub(int n, const float* a, const float* b, float* y) {
  if (ArgumentsValid("vsSub", n, a, b, y)) {
    for (int i = 0; i < n; ++i) {
      y[i] = a[i] - b[i];
    }
  }
}

void vsMul(int n, const float* a, const float* b, float* y) {
  if (ArgumentsValid("vsMul", n, a, b, y)) {
    for (int i = 0; i < n; ++i) {
      y[i] = a[i] * b[i];
    }
  }
}

// IEEE quotients are the contract: the scan's softmax turns 0 / 0 into NaN
// where every exponential underflowed, and the trained models expect it.
__attribute__((no_sanitize("float-divide-by-zero"))) void vsDiv(int n, const float* a,
                                                                const float* b, float* y) {
  if (ArgumentsValid("vsDiv", n, a, b, y)) {
    for (int i = 0; i < n; ++i) {
      y[i] = a[i] / b[i];
    }
  }
}

void vsSqr(int n, const float* a, float* y) {
  if (ArgumentsValid("vsSqr", n, a, a, y)) {
    for (int i = 0; i < n; ++i) {
      y[i] = a[i] * a[i];
    }
  }
}

void vsExp(int n, const float* a, float* y) {
  if (ArgumentsValid("vsExp", n, a, a, y)) {
    for (int i = 0; i < n; ++i) {
      y[i] = std::exp(a[i]);
    }
  }
}

void vsPowx(int n, const float* a, float b, float* y) {
  if (ArgumentsValid("vsPowx", n, a, a, y)) {
    for (int i = 0; i < n; ++i) {
      y[i] = std::pow(a[i], b);
    }
  }
}

void nn_add_scalar(int n, float alpha, float* y) {
  for (int i = 0; i < n; ++i) {
    y[i] += alpha;
  }
}

void nn_cpu_axpby(int n, float alpha, const float* x, float beta, float* y) {
  cblas_saxpby(n, alpha, x, 1, beta, y, 1);
}

void nn_cpu_sign(int n, const float* x, float* y) {
  CHECK_GT(n, 0);
  CHECK(x);
  CHECK(y);
  for (int i = 0; i < n; ++i) {
    y[i] = static_cast<float>((0.0f < x[i]) - (x[i] < 0.0f));
  }
}

}  // namespace nn
