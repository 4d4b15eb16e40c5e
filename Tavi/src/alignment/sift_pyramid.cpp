#include "alignment/sift_pyramid.h"

#include <algorithm>
#include <cmath>
#include <cstring>

// TAVI_PORTABLE builds the plain roads only; they give the same numbers.
#if defined(__SSE2__) && !defined(TAVI_PORTABLE)
#define TAVI_SSE2_ROADS 1
#include <emmintrin.h>
#include <immintrin.h>
#include <xmmintrin.h>
#endif
#if defined(TAVI_SSE2_ROADS) && (defined(__x86_64__) || defined(__i386__))
#define TAVI_AVX2_ROADS 1
#endif

namespace SDMCore {
namespace {

// base^e by repeated squaring in single precision; 1 for e = 0.
float powerBySquaring(float base, int e) {
  float result = 1.0f;
  while (e > 0) {
    if (e & 1) result *= base;
    base *= base;
    e >>= 1;
  }
  return result;
}

// The histogram is kept with a margin of one spatial cell above and left and
// of one below and right: rows and columns -3 .. 2 instead of -2 .. 1, so that
// every sample adds to its four cells without a range test. The margin cells
// are dropped at the end; the cells inside get exactly the additions they would
// get with the range tests, in the same order.
constexpr int kPaddedSide = 6;
constexpr int kPaddedBins = kPaddedSide * kPaddedSide * 8;

#if defined(TAVI_SSE2_ROADS)
// mask ? a : b, lane by lane.
inline __m128 select(__m128 mask, __m128 a, __m128 b) {
  return _mm_or_ps(_mm_and_ps(mask, a), _mm_andnot_ps(mask, b));
}
#endif

// The sum of squares of a histogram, in four interleaved partial sums (entry
// i goes to sum i % 4) added as (s0 + s1) + (s2 + s3). The order of this sum
// is free; this one runs in vector lanes.
float sumOfSquares(const float* h) {
  float s[4] = {0.0f, 0.0f, 0.0f, 0.0f};
  for (int i = 0; i < 128; i += 4) {
    for (int lane = 0; lane < 4; ++lane) s[lane] += h[i + lane] * h[i + lane];
  }
  return (s[0] + s[1]) + (s[2] + s[3]);
}

#if defined(TAVI_SSE2_ROADS)
// The unit vectors of the eight bins.
alignas(32) const float kUnit[8][8] = {
    {1, 0, 0, 0, 0, 0, 0, 0}, {0, 1, 0, 0, 0, 0, 0, 0}, {0, 0, 1, 0, 0, 0, 0, 0},
    {0, 0, 0, 1, 0, 0, 0, 0}, {0, 0, 0, 0, 1, 0, 0, 0}, {0, 0, 0, 0, 0, 1, 0, 0},
    {0, 0, 0, 0, 0, 0, 1, 0}, {0, 0, 0, 0, 0, 0, 0, 1}};
#endif

// One row of samples into the histogram rows top (row0) and top + 48
// (row0 + 1). Each sample adds w * (1 - tx) * (1 - ty) and so on to the main
// bin of its four cells and that times the ratio to the second bin, in sample
// order.
void accumulateRow(const SiftPyramid::SampleCell* line, const int64_t* dxs, const int* colBase,
                   const float* across, size_t columns, float uy, float ty, float* top) {
  float* bottom = top + kPaddedSide * 8;
#if defined(TAVI_SSE2_ROADS)
  // The four cells of the current column pair stay in registers while col0
  // stays the same. A sample's contribution to a cell is the cell's unit
  // vector of the main bin plus that of the second bin times the ratio, times
  // the corner weight: the two bins get exactly w and w * ratio, and the other
  // six get +0, which leaves them as they are. The additions per entry are
  // the scalar ones, in the same order.
  const __m128 absMask = _mm_castsi128_ps(_mm_set1_epi32(0x7fffffff));
  const __m128 down = _mm_setr_ps(uy, ty, uy, ty);
  int current = -1;
  __m128 tl0 = _mm_setzero_ps(), tl1 = tl0, tr0 = tl0, tr1 = tl0;
  __m128 bl0 = tl0, bl1 = tl0, br0 = tl0, br1 = tl0;
  for (size_t c = 0; c < columns; ++c) {
    const SiftPyramid::SampleCell& cell = line[dxs[c]];
    if (cell.weight == 0.0f) continue;
    const int base = colBase[c];
    if (base != current) {
      if (current >= 0) {
        _mm_store_ps(top + current, tl0);
        _mm_store_ps(top + current + 4, tl1);
        _mm_store_ps(top + current + 8, tr0);
        _mm_store_ps(top + current + 12, tr1);
        _mm_store_ps(bottom + current, bl0);
        _mm_store_ps(bottom + current + 4, bl1);
        _mm_store_ps(bottom + current + 8, br0);
        _mm_store_ps(bottom + current + 12, br1);
      }
      current = base;
      tl0 = _mm_load_ps(top + current);
      tl1 = _mm_load_ps(top + current + 4);
      tr0 = _mm_load_ps(top + current + 8);
      tr1 = _mm_load_ps(top + current + 12);
      bl0 = _mm_load_ps(bottom + current);
      bl1 = _mm_load_ps(bottom + current + 4);
      br0 = _mm_load_ps(bottom + current + 8);
      br1 = _mm_load_ps(bottom + current + 12);
    }
    // {a, a, b, b} = weight * {1 - tx, 1 - tx, tx, tx}; then the corners
    // {w00, w10, w01, w11} = |{a * (1 - ty), a * ty, b * (1 - ty), b * ty}|.
    const __m128 ab = _mm_mul_ps(_mm_set1_ps(cell.weight), _mm_loadu_ps(across + 4 * c));
    const __m128 corners = _mm_and_ps(_mm_mul_ps(ab, down), absMask);
    const __m128 ratio = _mm_set1_ps(cell.ratio);
    const float* mainUnit = kUnit[cell.mainBin];
    const float* secondUnit = kUnit[cell.secondBin];
    const __m128 v0 = _mm_add_ps(_mm_load_ps(mainUnit), _mm_mul_ps(_mm_load_ps(secondUnit), ratio));
    const __m128 v1 =
        _mm_add_ps(_mm_load_ps(mainUnit + 4), _mm_mul_ps(_mm_load_ps(secondUnit + 4), ratio));
    const __m128 w00 = _mm_shuffle_ps(corners, corners, 0x00);
    const __m128 w10 = _mm_shuffle_ps(corners, corners, 0x55);
    const __m128 w01 = _mm_shuffle_ps(corners, corners, 0xAA);
    const __m128 w11 = _mm_shuffle_ps(corners, corners, 0xFF);
    tl0 = _mm_add_ps(tl0, _mm_mul_ps(v0, w00));
    tl1 = _mm_add_ps(tl1, _mm_mul_ps(v1, w00));
    bl0 = _mm_add_ps(bl0, _mm_mul_ps(v0, w10));
    bl1 = _mm_add_ps(bl1, _mm_mul_ps(v1, w10));
    tr0 = _mm_add_ps(tr0, _mm_mul_ps(v0, w01));
    tr1 = _mm_add_ps(tr1, _mm_mul_ps(v1, w01));
    br0 = _mm_add_ps(br0, _mm_mul_ps(v0, w11));
    br1 = _mm_add_ps(br1, _mm_mul_ps(v1, w11));
  }
  if (current >= 0) {
    _mm_store_ps(top + current, tl0);
    _mm_store_ps(top + current + 4, tl1);
    _mm_store_ps(top + current + 8, tr0);
    _mm_store_ps(top + current + 12, tr1);
    _mm_store_ps(bottom + current, bl0);
    _mm_store_ps(bottom + current + 4, bl1);
    _mm_store_ps(bottom + current + 8, br0);
    _mm_store_ps(bottom + current + 12, br1);
  }
#else
  for (size_t c = 0; c < columns; ++c) {
    const SiftPyramid::SampleCell& cell = line[dxs[c]];
    // A zero magnitude adds zeros, which leave every entry as it is.
    if (cell.weight == 0.0f) continue;
    const float a = cell.weight * across[4 * c];
    const float b = cell.weight * across[4 * c + 2];
    const float w00 = std::fabs(a * uy);
    const float w10 = std::fabs(a * ty);
    const float w01 = std::fabs(b * uy);
    const float w11 = std::fabs(b * ty);
    const float ratio = cell.ratio;
    float* t = top + colBase[c];
    float* u = bottom + colBase[c];
    t[cell.mainBin] += w00;
    t[cell.secondBin] += w00 * ratio;
    u[cell.mainBin] += w10;
    u[cell.secondBin] += w10 * ratio;
    t[8 + cell.mainBin] += w01;
    t[8 + cell.secondBin] += w01 * ratio;
    u[8 + cell.mainBin] += w11;
    u[8 + cell.secondBin] += w11 * ratio;
  }
#endif
}

#if defined(TAVI_AVX2_ROADS)

const bool kWideRowsAvailable = [] {
  __builtin_cpu_init();  // this runs among the static constructors
  return __builtin_cpu_supports("avx2") != 0;
}();

// The same with eight-lane registers, one per cell: half the operations.
// (AVX2 for the register broadcasts; no fused multiply-add, which would
// change the roundings.)
__attribute__((target("avx2"))) void accumulateRowAvx(const SiftPyramid::SampleCell* line,
                                                     const int64_t* dxs, const int* colBase,
                                                     const float* across, size_t columns, float uy,
                                                     float ty, float* top) {
  float* bottom = top + kPaddedSide * 8;
  const __m128 absMask = _mm_castsi128_ps(_mm_set1_epi32(0x7fffffff));
  const __m128 down = _mm_setr_ps(uy, ty, uy, ty);
  int current = -1;
  __m256 tl = _mm256_setzero_ps(), tr = tl, bl = tl, br = tl;
  for (size_t c = 0; c < columns; ++c) {
    const SiftPyramid::SampleCell& cell = line[dxs[c]];
    if (cell.weight == 0.0f) continue;
    const int base = colBase[c];
    if (base != current) {
      if (current >= 0) {
        _mm256_store_ps(top + current, tl);
        _mm256_store_ps(top + current + 8, tr);
        _mm256_store_ps(bottom + current, bl);
        _mm256_store_ps(bottom + current + 8, br);
      }
      current = base;
      tl = _mm256_load_ps(top + current);
      tr = _mm256_load_ps(top + current + 8);
      bl = _mm256_load_ps(bottom + current);
      br = _mm256_load_ps(bottom + current + 8);
    }
    const __m128 ab = _mm_mul_ps(_mm_set1_ps(cell.weight), _mm_loadu_ps(across + 4 * c));
    const __m128 corners = _mm_and_ps(_mm_mul_ps(ab, down), absMask);
    const __m256 v = _mm256_add_ps(_mm256_load_ps(kUnit[cell.mainBin]),
                                   _mm256_mul_ps(_mm256_load_ps(kUnit[cell.secondBin]),
                                                 _mm256_set1_ps(cell.ratio)));
    const __m256 wide = _mm256_castps128_ps256(corners);
    const __m256 w00 = _mm256_permutevar8x32_ps(wide, _mm256_set1_epi32(0));
    const __m256 w10 = _mm256_permutevar8x32_ps(wide, _mm256_set1_epi32(1));
    const __m256 w01 = _mm256_permutevar8x32_ps(wide, _mm256_set1_epi32(2));
    const __m256 w11 = _mm256_permutevar8x32_ps(wide, _mm256_set1_epi32(3));
    tl = _mm256_add_ps(tl, _mm256_mul_ps(v, w00));
    bl = _mm256_add_ps(bl, _mm256_mul_ps(v, w10));
    tr = _mm256_add_ps(tr, _mm256_mul_ps(v, w01));
    br = _mm256_add_ps(br, _mm256_mul_ps(v, w11));
  }
  if (current >= 0) {
    _mm256_store_ps(top + current, tl);
    _mm256_store_ps(top + current + 8, tr);
    _mm256_store_ps(bottom + current, bl);
    _mm256_store_ps(bottom + current + 8, br);
  }
}

#endif

#if defined(TAVI_AVX2_ROADS)
// Whether accumulateRowAvx may run: the processor has it and no test has
// switched it off.
bool wideRows = kWideRowsAvailable;
#endif

}  // namespace

bool SiftPyramid::setWideHistogramRows(bool enabled) {
#if defined(TAVI_AVX2_ROADS)
  wideRows = enabled && kWideRowsAvailable;
  return wideRows;
#else
  (void)enabled;
  return false;
#endif
}

void FloatImage::resize(uint64_t newWidth, uint64_t newHeight) {
  const uint64_t count = newWidth * newHeight;
  if (storage.size() < count) storage.resize(count);
  width = newWidth;
  height = newHeight;
  pixels = storage.data();
}

float fastAngle(float dx, float dy) {
  float a;
  if (dx == 0.0f) {
    if (dy == 0.0f) {
      a = 0.0f;
    } else {
      a = dy > 0.0f ? kHalfPi : -kHalfPi;
    }
  } else {
    const float r = dy / dx;
    if (std::fabs(r) <= 1.0f) {
      a = r / (r * 0.28f * r + 1.0f);
      if (dx < 0.0f) {
        if (dy < 0.0f) {
          a -= kPi;
        } else {
          a += kPi;
        }
      }
    } else {
      a = kHalfPi - r / (r * r + 0.28f);
      if (dy < 0.0f) a -= kPi;
    }
  }
  while (a < 0.0f) a += kTwoPi;
  return a;
}

GradientCell splitOrientation(float angle, float magnitude) {
  GradientCell cell;
  cell.magnitude = magnitude;
  const float p = angle * 8.0f / kTwoPi;
  int b = static_cast<int>(p + 0.5f);
  int second;
  const float bin = static_cast<float>(b);
  if (p > bin) {
    cell.secondWeight = p - bin;
    cell.mainWeight = 1.0f - (p - bin);
    second = b == 7 ? 0 : b + 1;
    if (b == 8) {
      b = 0;
      second = 1;
    }
  } else {
    cell.secondWeight = bin - p;
    cell.mainWeight = 1.0f - (bin - p);
    second = b == 0 ? 7 : b - 1;
    if (b == 8) b = 0;
  }
  cell.mainBin = static_cast<uint8_t>(b);
  cell.secondBin = static_cast<uint8_t>(second);
  cell.unused[0] = 0;
  cell.unused[1] = 0;
  return cell;
}

GradientCell gradientCell(float dx, float dy) {
  const float magnitude = std::sqrt(dy * dy + dx * dx);
  return splitOrientation(fastAngle(dx, dy), magnitude);
}

std::vector<float> gaussianKernel(float sigma) {
  const double s = sigma;
  const int r = static_cast<int>(s * 3.5 + 0.5);
  const int size = 2 * r + 1;
  const double t = 1.0 / (s * std::sqrt(2.0));
  std::vector<double> weights(size);
  double side = 0.0;
  for (int i = 1; i <= r; ++i) {
    double w;
    if (i * t < 2.5) {
      w = std::erf((i + 0.5) * t) - std::erf((i - 0.5) * t);
    } else {
      // The tail keeps its precision in the complementary form.
      w = std::erfc((i - 0.5) * t) - std::erfc((i + 0.5) * t);
    }
    weights[r - i] = w;
    weights[r + i] = w;
    side += w;
  }
  const double centre = std::erf(t * 0.5) - std::erf(-t * 0.5);
  weights[r] = centre;
  const float total = static_cast<float>(2.0 * side + centre);
  std::vector<float> kernel(size);
  for (int i = 0; i < size; ++i) kernel[i] = static_cast<float>(weights[i]) / total;
  return kernel;
}

namespace {

// out[i] = sum over j of kernel[j] * rows[j][i], added from 0 in ascending j.
// Each output is its own running sum, so blocks of outputs run in vector
// lanes with the sums kept in registers over j.
void weightedSum(const float* const* rows, const float* kernel, size_t size, size_t width,
                 float* out) {
  size_t i = 0;
#if defined(TAVI_SSE2_ROADS)
  for (; i + 16 <= width; i += 16) {
    __m128 a0 = _mm_setzero_ps(), a1 = a0, a2 = a0, a3 = a0;
    for (size_t j = 0; j < size; ++j) {
      const __m128 k = _mm_set1_ps(kernel[j]);
      const float* in = rows[j] + i;
      a0 = _mm_add_ps(a0, _mm_mul_ps(k, _mm_loadu_ps(in)));
      a1 = _mm_add_ps(a1, _mm_mul_ps(k, _mm_loadu_ps(in + 4)));
      a2 = _mm_add_ps(a2, _mm_mul_ps(k, _mm_loadu_ps(in + 8)));
      a3 = _mm_add_ps(a3, _mm_mul_ps(k, _mm_loadu_ps(in + 12)));
    }
    _mm_storeu_ps(out + i, a0);
    _mm_storeu_ps(out + i + 4, a1);
    _mm_storeu_ps(out + i + 8, a2);
    _mm_storeu_ps(out + i + 12, a3);
  }
#endif
  for (; i < width; ++i) {
    float sum = 0.0f;
    for (size_t j = 0; j < size; ++j) sum += kernel[j] * rows[j][i];
    out[i] = sum;
  }
}

}  // namespace

void convolveSeparable(const float* src, size_t width, size_t height, const float* kernel,
                       int radius, float* dst) {
  if (width == 0 || height == 0) return;
  const size_t size = static_cast<size_t>(2 * radius + 1);
  if (size == 1) {
    const float k = kernel[0];
    for (size_t i = 0; i < width * height; ++i) dst[i] = src[i] * k * k;
    return;
  }
  std::vector<const float*> rows(size);
  // Horizontal pass into a buffer: a line of radius copies of the first pixel,
  // the row, and radius copies of the last one; out[i] sums line[i + j].
  std::vector<float> buffer(width * height);
  std::vector<float> line(width + size - 1);
  for (size_t y = 0; y < height; ++y) {
    const float* in = src + y * width;
    std::fill(line.begin(), line.begin() + radius, in[0]);
    std::copy(in, in + width, line.begin() + radius);
    std::fill(line.begin() + radius + width, line.end(), in[width - 1]);
    for (size_t j = 0; j < size; ++j) rows[j] = line.data() + j;
    weightedSum(rows.data(), kernel, size, width, buffer.data() + y * width);
  }
  // Vertical pass from the buffer into dst, the column's ends replicated; the
  // rows are walked whole, each element with the same sum as a column line.
  for (size_t y = 0; y < height; ++y) {
    for (size_t j = 0; j < size; ++j) {
      const int64_t source = std::min<int64_t>(
          std::max<int64_t>(static_cast<int64_t>(y) + static_cast<int64_t>(j) - radius, 0),
          static_cast<int64_t>(height) - 1);
      rows[j] = buffer.data() + static_cast<size_t>(source) * width;
    }
    weightedSum(rows.data(), kernel, size, width, dst + y * width);
  }
}

SiftPyramid::SiftPyramid(uint64_t width, uint64_t height, uint64_t S)
    : width_(width),
      height_(height),
      S_(S),
      levels_(S + 3),
      gradients_(S + 3),
      k_(static_cast<float>(std::pow(2.0, 1.0 / static_cast<double>(S)))) {
  for (FloatImage& level : levels_) level.resize(width, height);
}

void SiftPyramid::buildBase(uint64_t width, uint64_t height, const uint8_t* pixels) {
  FloatImage& source = levels_[1];
  source.resize(width, height);
  for (uint64_t y = 0; y < height; ++y) {
    float* row = source.row(y);
    const uint8_t* in = pixels + y * width;
    for (uint64_t x = 0; x < width; ++x) row[x] = static_cast<float>(in[x]);
    for (uint64_t x = 0; x < width; ++x) row[x] /= 255.0f;
  }
  FloatImage& base = levels_[0];
  base.resize(width, height);
  const float sigmaIn = kBaseSigmaIn;
  const float sigmaOut = kBaseSigma;
  if (sigmaOut > sigmaIn) {
    const std::vector<float> kernel = gaussianKernel(std::sqrt(sigmaOut * sigmaOut - sigmaIn * sigmaIn));
    convolveSeparable(source.pixels, width, height, kernel.data(),
                      static_cast<int>(kernel.size() / 2), base.pixels);
  } else {
    std::memcpy(base.pixels, source.pixels, width * height * sizeof(float));
  }
}

void SiftPyramid::buildLevels() { buildLevels(S_ + 2); }

void SiftPyramid::buildLevels(uint64_t highest) {
  const float step = std::sqrt(k_ * k_ - 1.0f);
  float sigma = step * kBaseSigma;
  for (uint64_t i = 0; i <= S_ + 1 && i < highest; ++i) {
    const std::vector<float> kernel = gaussianKernel(sigma);
    levels_[i + 1].resize(levels_[i].width, levels_[i].height);
    convolveSeparable(levels_[i].pixels, levels_[i].width, levels_[i].height, kernel.data(),
                      static_cast<int>(kernel.size() / 2), levels_[i + 1].pixels);
    sigma = sigma * k_;
  }
}

float SiftPyramid::binWidth(int level) const {
  return powerBySquaring(k_, level) * kBaseSigma * kBinSigmas;
}

int SiftPyramid::radius(int level) const {
  // Four bins a side: the square is a little smaller than the outer bins reach.
  return static_cast<int>(static_cast<double>(binWidth(level)) * std::sqrt(2.0) * 4.0 * 0.5 + 0.5);
}

void SiftPyramid::ensureGradient(int level) {
  std::vector<SampleCell>& cells = gradients_[level];
  if (!cells.empty()) return;
  const FloatImage& image = levels_[level];
  const uint64_t w = image.width;
  const uint64_t h = image.height;
  cells.assign(w * h, SampleCell{0.0f, 0.0f, 0, 0, {0, 0, 0, 0, 0, 0}});
  if (cells.empty()) cells.resize(1);  // marks an empty level as filled
  for (uint64_t y = 1; y + 1 < h; ++y) {
    const float* above = image.row(y - 1);
    const float* row = image.row(y);
    const float* below = image.row(y + 1);
    SampleCell* out = cells.data() + y * w;
    uint64_t x = 1;
#if defined(TAVI_SSE2_ROADS)
    // Four pixels at a time, every branch of the scalar road computed and the
    // lane's own selected: the same operations on the same values.
    const __m128 zero = _mm_setzero_ps();
    const __m128 one = _mm_set1_ps(1.0f);
    const __m128 absMask = _mm_castsi128_ps(_mm_set1_epi32(0x7fffffff));
    const __m128 pi = _mm_set1_ps(kPi);
    const __m128 halfPi = _mm_set1_ps(kHalfPi);
    const __m128 twoPi = _mm_set1_ps(kTwoPi);
    const __m128 c028 = _mm_set1_ps(0.28f);
    for (; x + 4 < w; x += 4) {
      const __m128 dx = _mm_sub_ps(_mm_loadu_ps(row + x + 1), _mm_loadu_ps(row + x - 1));
      const __m128 dy = _mm_sub_ps(_mm_loadu_ps(below + x), _mm_loadu_ps(above + x));
      const __m128 magnitude = _mm_sqrt_ps(_mm_add_ps(_mm_mul_ps(dy, dy), _mm_mul_ps(dx, dx)));
      const __m128 r = _mm_div_ps(dy, dx);
      const __m128 dyNegative = _mm_cmplt_ps(dy, zero);
      // |r| <= 1: r / (r * 0.28 * r + 1), moved by pi for dx < 0.
      __m128 near = _mm_div_ps(r, _mm_add_ps(_mm_mul_ps(_mm_mul_ps(r, c028), r), one));
      const __m128 shifted = select(dyNegative, _mm_sub_ps(near, pi), _mm_add_ps(near, pi));
      near = select(_mm_cmplt_ps(dx, zero), shifted, near);
      // |r| > 1: HALF_PI - r / (r * r + 0.28), lowered by pi for dy < 0.
      __m128 far = _mm_sub_ps(halfPi, _mm_div_ps(r, _mm_add_ps(_mm_mul_ps(r, r), c028)));
      far = select(dyNegative, _mm_sub_ps(far, pi), far);
      __m128 a = select(_mm_cmple_ps(_mm_and_ps(r, absMask), one), near, far);
      // dx = 0: 0, HALF_PI or -HALF_PI by the sign of dy.
      const __m128 vertical =
          select(_mm_cmpeq_ps(dy, zero), zero,
                 select(_mm_cmpgt_ps(dy, zero), halfPi, _mm_sub_ps(zero, halfPi)));
      a = select(_mm_cmpeq_ps(dx, zero), vertical, a);
      // One turn is enough: a is never below -2 pi.
      a = select(_mm_cmplt_ps(a, zero), _mm_add_ps(a, twoPi), a);
      // The two-bin split.
      const __m128 p = _mm_div_ps(_mm_mul_ps(a, _mm_set1_ps(8.0f)), twoPi);
      const __m128i b = _mm_cvttps_epi32(_mm_add_ps(p, _mm_set1_ps(0.5f)));
      const __m128 bin = _mm_cvtepi32_ps(b);
      const __m128 above_ = _mm_cmpgt_ps(p, bin);
      const __m128 diff = select(above_, _mm_sub_ps(p, bin), _mm_sub_ps(bin, p));
      const __m128 mainWeight = _mm_sub_ps(one, diff);
      const __m128 weight = _mm_mul_ps(magnitude, mainWeight);
      const __m128 ratio = _mm_div_ps(diff, _mm_add_ps(mainWeight, _mm_set1_ps(0.000001f)));
      const __m128i seven = _mm_set1_epi32(7);
      const __m128i mainBin = _mm_and_si128(b, seven);
      const __m128i up = _mm_and_si128(_mm_add_epi32(b, _mm_set1_epi32(1)), seven);
      const __m128i downBin = _mm_and_si128(_mm_add_epi32(b, seven), seven);
      const __m128i aboveMask = _mm_castps_si128(above_);
      const __m128i secondBin =
          _mm_or_si128(_mm_and_si128(aboveMask, up), _mm_andnot_si128(aboveMask, downBin));
      // Cells of {weight, ratio, mainBin | secondBin << 8, 0}.
      __m128 c0 = weight;
      __m128 c1 = ratio;
      __m128 c2 = _mm_castsi128_ps(_mm_or_si128(mainBin, _mm_slli_epi32(secondBin, 8)));
      __m128 c3 = zero;
      _MM_TRANSPOSE4_PS(c0, c1, c2, c3);
      _mm_store_ps(reinterpret_cast<float*>(out + x), c0);
      _mm_store_ps(reinterpret_cast<float*>(out + x + 1), c1);
      _mm_store_ps(reinterpret_cast<float*>(out + x + 2), c2);
      _mm_store_ps(reinterpret_cast<float*>(out + x + 3), c3);
    }
#endif
    for (; x + 1 < w; ++x) {
      const float dx = row[x + 1] - row[x - 1];
      const float dy = below[x] - above[x];
      const GradientCell g = gradientCell(dx, dy);
      SampleCell& cell = out[x];
      cell.weight = g.magnitude * g.mainWeight;
      cell.ratio = g.secondWeight / (g.mainWeight + 0.000001f);
      cell.mainBin = g.mainBin;
      cell.secondBin = g.secondBin;
    }
  }
}

void SiftPyramid::computeDescriptor(float x, float y, float level, float& norm, uint8_t out[128]) {
  const int64_t xi = static_cast<int64_t>(static_cast<double>(x) + 0.5);
  const int64_t yi = static_cast<int64_t>(static_cast<double>(y) + 0.5);
  const int s = static_cast<int>(static_cast<double>(level) + 0.5);
  const float ox = static_cast<float>(xi) - x;
  const float oy = static_cast<float>(yi) - y;
  const float binW = binWidth(s);
  const int64_t R = radius(s);
  const int64_t w = static_cast<int64_t>(width_);
  const int64_t h = static_cast<int64_t>(height_);
  const int64_t dxLo = std::max(-R, 1 - xi);
  const int64_t dxHi = std::min(w - xi - 2, R);
  const int64_t dyLo = std::max(-R, 1 - yi);
  const int64_t dyHi = std::min(h - yi - 2, R);
  ensureGradient(s);

  // Per column of the window: the histogram column and the weights across it.
  // Samples whose four cells all fall outside the histogram add nothing and
  // are left out.
  std::vector<int64_t>& dxs = scratchDx_;
  std::vector<int>& colBase = scratchColumn_;
  std::vector<float>& across = scratchAcross_;  // 1 - tx, 1 - tx, tx, tx
  const size_t span = static_cast<size_t>(std::max<int64_t>(0, dxHi - dxLo + 1));
  if (dxs.size() < span) {
    dxs.resize(span);
    colBase.resize(span);
    across.resize(4 * span);
  }
  size_t columns = 0;
  for (int64_t dx = dxLo; dx <= dxHi; ++dx) {
    const float fx = (static_cast<float>(dx) + ox) / binW - 0.5f;
    const float col0 = std::floor(fx);
    if (col0 < -3.0f || col0 > 1.0f) continue;
    const float tx = fx - col0;
    dxs[columns] = dx;
    colBase[columns] = (static_cast<int>(col0) + 3) * 8;
    float* a = &across[4 * columns];
    a[0] = 1.0f - tx;
    a[1] = 1.0f - tx;
    a[2] = tx;
    a[3] = tx;
    ++columns;
  }

  alignas(32) float padded[kPaddedBins] = {};
  const std::vector<SampleCell>& cells = gradients_[s];
  for (int64_t dy = dyLo; dy <= dyHi; ++dy) {
    const float fy = (static_cast<float>(dy) + oy) / binW - 0.5f;
    const float row0 = std::floor(fy);
    if (row0 < -3.0f || row0 > 1.0f) continue;
    const float ty = fy - row0;
    const float uy = 1.0f - ty;
    float* top = padded + (static_cast<int>(row0) + 3) * kPaddedSide * 8;
    const SampleCell* line = cells.data() + (yi + dy) * w + xi;
#if defined(TAVI_AVX2_ROADS)
    if (wideRows) {
      accumulateRowAvx(line, dxs.data(), colBase.data(), across.data(), columns, uy, ty, top);
      continue;
    }
#endif
    accumulateRow(line, dxs.data(), colBase.data(), across.data(), columns, uy, ty, top);
  }

  float hist[128];
  for (int row = 0; row < 4; ++row) {
    for (int col = 0; col < 4; ++col) {
      const float* from = padded + ((row + 1) * kPaddedSide + (col + 1)) * 8;
      std::copy(from, from + 8, hist + (row * 4 + col) * 8);
    }
  }

  const float total = std::sqrt(sumOfSquares(hist));
  norm = total;
  // A floor on the gradient energy: the caller's buffer keeps what it held.
  if (total <= 0.5f) {
    norm = 0.0f;
    return;
  }
  for (int i = 0; i < 128; ++i) {
    hist[i] /= total;
    if (hist[i] > kClampValue) hist[i] = kClampValue;
  }
  const float length = std::sqrt(sumOfSquares(hist));
  for (int i = 0; i < 128; ++i) {
    hist[i] /= length;
    out[i] = static_cast<uint8_t>(static_cast<int>(hist[i] * 255.0f + 0.5f));
  }
}

}  // namespace SDMCore
