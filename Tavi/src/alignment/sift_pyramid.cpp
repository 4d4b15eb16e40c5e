#include "alignment/sift_pyramid.h"

#include <algorithm>
#include <cmath>
#include <cstring>

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

}  // namespace

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

void convolveSeparable(const float* src, size_t width, size_t height, const float* kernel,
                       int radius, float* dst) {
  if (width == 0 || height == 0) return;
  const size_t size = static_cast<size_t>(2 * radius + 1);
  if (size == 1) {
    const float k = kernel[0];
    for (size_t i = 0; i < width * height; ++i) dst[i] = src[i] * k * k;
    return;
  }
  // Horizontal pass into a buffer: a line of radius copies of the first pixel,
  // the row, and radius copies of the last one. Each output keeps its own sum
  // in ascending j, so the loop over i may run in vector lanes.
  std::vector<float> buffer(width * height);
  std::vector<float> line(width + size - 1);
  for (size_t y = 0; y < height; ++y) {
    const float* in = src + y * width;
    std::fill(line.begin(), line.begin() + radius, in[0]);
    std::copy(in, in + width, line.begin() + radius);
    std::fill(line.begin() + radius + width, line.end(), in[width - 1]);
    float* out = buffer.data() + y * width;
    std::fill(out, out + width, 0.0f);
    for (size_t j = 0; j < size; ++j) {
      const float k = kernel[j];
      const float* shifted = line.data() + j;
      for (size_t i = 0; i < width; ++i) out[i] += k * shifted[i];
    }
  }
  // Vertical pass from the buffer into dst, the column's border replicated;
  // rows are walked whole for the same per-element order.
  for (size_t y = 0; y < height; ++y) {
    float* out = dst + y * width;
    std::fill(out, out + width, 0.0f);
    for (size_t j = 0; j < size; ++j) {
      const int64_t source_row = std::min<int64_t>(
          std::max<int64_t>(static_cast<int64_t>(y) + static_cast<int64_t>(j) - radius, 0),
          static_cast<int64_t>(height) - 1);
      const float k = kernel[j];
      const float* in = buffer.data() + static_cast<size_t>(source_row) * width;
      for (size_t i = 0; i < width; ++i) out[i] += k * in[i];
    }
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

void SiftPyramid::buildLevels() {
  const float step = std::sqrt(k_ * k_ - 1.0f);
  float sigma = step * kBaseSigma;
  for (uint64_t i = 0; i <= S_ + 1; ++i) {
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
    for (uint64_t x = 1; x + 1 < w; ++x) {
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

  // Per column of the window: the histogram column and the weight across it.
  // Samples whose four cells all fall outside the histogram add nothing and
  // are left out.
  const int64_t span = std::max<int64_t>(0, 2 * R + 1);
  std::vector<int64_t> dxs;
  std::vector<int> colBase;
  std::vector<float> txs;
  dxs.reserve(span);
  colBase.reserve(span);
  txs.reserve(span);
  for (int64_t dx = dxLo; dx <= dxHi; ++dx) {
    const float fx = (static_cast<float>(dx) + ox) / binW - 0.5f;
    const float col0 = std::floor(fx);
    if (col0 < -3.0f || col0 > 1.0f) continue;
    dxs.push_back(dx);
    colBase.push_back((static_cast<int>(col0) + 3) * 8);
    txs.push_back(fx - col0);
  }

  float padded[kPaddedBins] = {};
  const std::vector<SampleCell>& cells = gradients_[s];
  const size_t columns = dxs.size();
  for (int64_t dy = dyLo; dy <= dyHi; ++dy) {
    const float fy = (static_cast<float>(dy) + oy) / binW - 0.5f;
    const float row0 = std::floor(fy);
    if (row0 < -3.0f || row0 > 1.0f) continue;
    const float ty = fy - row0;
    const float uy = 1.0f - ty;
    float* rowHist = padded + (static_cast<int>(row0) + 3) * kPaddedSide * 8;
    const SampleCell* line = cells.data() + (yi + dy) * w + xi;
    for (size_t c = 0; c < columns; ++c) {
      const SampleCell& cell = line[dxs[c]];
      // A zero magnitude adds zeros, which leave every entry as it is.
      if (cell.weight == 0.0f) continue;
      const float tx = txs[c];
      const float a = cell.weight * (1.0f - tx);
      const float b = cell.weight * tx;
      const float w00 = std::fabs(a * uy);
      const float w10 = std::fabs(a * ty);
      const float w01 = std::fabs(b * uy);
      const float w11 = std::fabs(b * ty);
      const float ratio = cell.ratio;
      float* top = rowHist + colBase[c];
      float* bottom = top + kPaddedSide * 8;
      top[cell.mainBin] += w00;
      top[cell.secondBin] += w00 * ratio;
      bottom[cell.mainBin] += w10;
      bottom[cell.secondBin] += w10 * ratio;
      top[8 + cell.mainBin] += w01;
      top[8 + cell.secondBin] += w01 * ratio;
      bottom[8 + cell.mainBin] += w11;
      bottom[8 + cell.secondBin] += w11 * ratio;
    }
  }

  float hist[128];
  for (int row = 0; row < 4; ++row) {
    for (int col = 0; col < 4; ++col) {
      const float* from = padded + ((row + 1) * kPaddedSide + (col + 1)) * 8;
      std::copy(from, from + 8, hist + (row * 4 + col) * 8);
    }
  }

  float sum = 0.0f;
  for (int i = 0; i < 128; ++i) sum += hist[i] * hist[i];
  const float total = std::sqrt(sum);
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
  sum = 0.0f;
  for (int i = 0; i < 128; ++i) sum += hist[i] * hist[i];
  const float length = std::sqrt(sum);
  for (int i = 0; i < 128; ++i) {
    hist[i] /= length;
    out[i] = static_cast<uint8_t>(static_cast<int>(hist[i] * 255.0f + 0.5f));
  }
}

}  // namespace SDMCore
