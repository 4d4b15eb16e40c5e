#include "alignment/resize_antialias.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <iostream>
#include <vector>

namespace tavilib {
namespace {

const double kPi = 3.14159265358979323846;

// sin(pi x) / (pi x), 1 at 0; pi x formed in double and cut to float.
float sinc(float x) {
  if (x == 0.0f) return 1.0f;
  const float pix = static_cast<float>(kPi * static_cast<double>(x));
  return std::sin(pix) / pix;
}

// The taps of every destination index of one pass: index i reads source
// positions first[i] .. first[i] + count[i] - 1 with weights
// weights[i * stride ..], and its sum is multiplied by norm[i].
struct TapTable {
  std::vector<int> first;
  std::vector<int> count;
  std::vector<float> norm;
  std::vector<float> weights;
  int stride = 0;
};

TapTable makeTaps(int srcLen, int dstLen) {
  TapTable table;
  if (dstLen <= 0) return table;
  const float ratio = static_cast<float>(srcLen) / static_cast<float>(dstLen);
  float filterScale;
  float support;
  if (ratio >= 1.0f) {
    filterScale = ratio;
    support = 3.0f * ratio;
  } else {
    // Enlarging: the half-width is 0.5, so only the nearest samples blend.
    filterScale = 1.0f;
    support = 0.5f;
  }
  const float invScale = 1.0f / filterScale;
  table.stride = static_cast<int>(support) * 2 + 10;
  table.first.resize(dstLen);
  table.count.resize(dstLen);
  table.norm.resize(dstLen);
  table.weights.assign(static_cast<size_t>(dstLen) * table.stride, 0.0f);
  for (int i = 0; i < dstLen; ++i) {
    const float centre = (static_cast<float>(i) + 0.5f) * ratio;
    const int first = static_cast<int>(std::max(0.0f, std::floor(centre - support)));
    const int last =
        static_cast<int>(std::min(static_cast<float>(srcLen), std::ceil(centre + support)));
    float* weights = &table.weights[static_cast<size_t>(i) * table.stride];
    float sum = 0.0f;
    for (int j = first; j < last; ++j) {
      const float w = lanczos3((static_cast<float>(j) - centre + 0.5f) * invScale) * invScale;
      weights[j - first] = w;
      sum += w;
    }
    table.first[i] = first;
    table.count[i] = std::max(0, last - first);
    table.norm[i] = sum != 0.0f ? 1.0f / sum : 1.0f;
  }
  return table;
}

// Every destination row i of dst blends source rows of src taps.first[i] ..;
// each element of the row keeps its own running sum, in tap order, so the
// loop over the row runs in vector lanes. dst has taps' length of rows and
// src's row length.
void verticalPass(const cv::Mat& src, cv::Mat& dst, const TapTable& taps) {
  const size_t length = static_cast<size_t>(src.cols) * 3;
  std::vector<float> acc(length);
  for (int i = 0; i < dst.rows; ++i) {
    const float* weights = &taps.weights[static_cast<size_t>(i) * taps.stride];
    std::fill(acc.begin(), acc.end(), 0.0f);
    for (int t = 0; t < taps.count[i]; ++t) {
      const uint8_t* in = src.ptr<uint8_t>(taps.first[i] + t);
      const float w = weights[t];
      for (size_t k = 0; k < length; ++k) acc[k] += static_cast<float>(in[k]) * w;
    }
    uint8_t* out = dst.ptr<uint8_t>(i);
    const float norm = taps.norm[i];
    for (size_t k = 0; k < length; ++k) {
      // v below 0.5 gives 0, 255 and above give 255, the rest is truncated;
      // written with a floor at 0 (truncation of [0, 0.5) is 0 too) to run in lanes.
      const float v = acc[k] * norm + 0.5f;
      out[k] = static_cast<uint8_t>(static_cast<int>(std::min(std::max(v, 0.0f), 255.0f)));
    }
  }
}

// Rows become columns: out(x, y) = in(y, x), three bytes a pixel.
void transposePixels(const cv::Mat& in, cv::Mat& out) {
  out.create(in.cols, in.rows, in.type());
  constexpr int kBlock = 32;
  for (int y0 = 0; y0 < in.rows; y0 += kBlock) {
    for (int x0 = 0; x0 < in.cols; x0 += kBlock) {
      const int y1 = std::min(in.rows, y0 + kBlock);
      const int x1 = std::min(in.cols, x0 + kBlock);
      for (int y = y0; y < y1; ++y) {
        const uint8_t* from = in.ptr<uint8_t>(y);
        for (int x = x0; x < x1; ++x) {
          uint8_t* to = out.ptr<uint8_t>(x) + static_cast<size_t>(y) * 3;
          to[0] = from[x * 3];
          to[1] = from[x * 3 + 1];
          to[2] = from[x * 3 + 2];
        }
      }
    }
  }
}

// Along the rows: every destination column i blends source columns. Done as
// the column pass of the transposed image, which gives every sample the same
// sum in the same order.
void horizontalPass(const cv::Mat& src, cv::Mat& dst, const TapTable& taps) {
  cv::Mat transposed;
  transposePixels(src, transposed);
  cv::Mat blended(dst.cols, dst.rows, src.type());
  verticalPass(transposed, blended, taps);
  transposePixels(blended, dst);
}

}  // namespace

float lanczos3(float x) {
  if (!(x >= -3.0f && x < 3.0f)) return 0.0f;
  const float third = x / 3.0f;
  if (third == 0.0f) return sinc(x);
  return sinc(x) * sinc(third);
}

cv::Mat resize_antialias(const cv::Mat& src, cv::Size size) {
  if ((src.flags & 0xFFF) != CV_8UC3) {
    std::cerr << "Error: resize_antialias type" << std::endl;
    return src;
  }
  // The pass that leaves fewer pixels goes first.
  cv::Mat intermediate;
  if (src.cols * size.height < src.rows * size.width) {
    intermediate = resize_antialias_oracle(src, src.cols, size.height);
  } else {
    intermediate = resize_antialias_oracle(src, size.width, src.rows);
  }
  return resize_antialias_oracle(intermediate, size.width, size.height);
}

cv::Mat resize_antialias_oracle(const cv::Mat& src, int width, int height) {
  const int rows = src.rows;
  const int columns = src.cols;
  const bool horizontal = rows == height;
  if (!horizontal && columns != width) {
    std::cerr << "Error: resize_antialias_oracle size" << std::endl;
    return cv::Mat();
  }
  cv::Mat dst(height, width, src.type());
  if (horizontal) {
    horizontalPass(src, dst, makeTaps(columns, width));
  } else {
    verticalPass(src, dst, makeTaps(rows, height));
  }
  return dst;
}

}  // namespace tavilib
