#ifndef NN_UTIL_MATH_FUNCTIONS_H_
#define NN_UTIL_MATH_FUNCTIONS_H_

// The dense arithmetic of the engine and of alignment: the standard CBLAS
// entry points (from the system's CBLAS, single precision, row-major, unit
// strides) plus the extension routines below, which are the engine's own.
#include <cblas.h>

namespace nn {

// y = alpha * x + beta * y. Unlike some CBLAS builds, always present.
void cblas_saxpby(int n, float alpha, const float* x, int incx, float beta, float* y, int incy);

// Element-wise vector routines. y may be the same array as a or b. With n 0
// they do nothing; with n below 0, or a null array while n is above 0, they
// log a parameter error and return without touching y.
void vsAdd(int n, const float* a, const float* b, float* y);
void vsSub(int n, const float* a, const float* b, float* y);
void vsMul(int n, const float* a, const float* b, float* y);
void vsDiv(int n, const float* a, const float* b, float* y);
void vsSqr(int n, const float* a, float* y);
void vsExp(int n, const float* a, float* y);
// y = a to the power b, b a scalar.
void vsPowx(int n, const float* a, float b, float* y);

// y[i] += alpha.
void nn_add_scalar(int n, float alpha, float* y);
// cblas_saxpby with unit strides.
void nn_cpu_axpby(int n, float alpha, const float* x, float beta, float* y);
// y[i] = 1, 0 or -1 by the sign of x[i]; 0 for NaN.
// REQUIRES: n > 0, x and y not null.
void nn_cpu_sign(int n, const float* x, float* y);

// Random draws from the engine's one generator, seeded at its first use.
// Not thread-safe. n samples uniform in [a, b], b included.
void nn_rng_uniform(int n, float a, float b, float* r);
// n samples of a normal distribution.
// REQUIRES: sigma > 0.
void nn_rng_gaussian(int n, float mu, float sigma, float* r);
// r[i] = 1 with probability p, else 0; the double form compares in double, the
// float form in float.
// REQUIRES: 0 <= p <= 1.
void nn_rng_bernoulli(int n, double p, int* r);
void nn_rng_bernoulli(int n, float p, int* r);

// Unfolds every ksize x ksize patch of a (channels, height, width) image into
// a column of data_col: channels * ksize * ksize rows, one column per output
// position. Padding cells are written as zeros; every cell is written.
void im2col(const float* data_im, int channels, int height, int width, int ksize, int pad,
            int stride, float* data_col);
// The same for the output rows [row_begin, row_end) only: the columns of
// those rows, packed, (row_end - row_begin) * width_col to a channel row.
void im2col_rows(const float* data_im, int channels, int height, int width, int ksize, int pad,
                 int stride, int row_begin, int row_end, float* data_col);
// The adjoint of im2col: clears data_im and sums each column cell back into
// its pixel.
void col2im(const float* data_col, int channels, int height, int width, int ksize, int pad,
            int stride, float* data_im);

}  // namespace nn

#endif  // NN_UTIL_MATH_FUNCTIONS_H_
