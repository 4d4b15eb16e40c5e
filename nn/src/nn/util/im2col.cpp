#include <algorithm>
#include <cstring>

#include "nn/util/math_functions.h"

namespace nn {

namespace {

int OutputSize(int size, int ksize, int pad, int stride) {
  return (size + 2 * pad - ksize) / stride + 1;
}

// The output columns w whose input column w * stride - pad + offset lies in
// [0, width): w in [first, last).
void InsideColumns(int width, int width_col, int pad, int stride, int offset, int* first,
                   int* last) {
  const int shift = offset - pad;  // input column of output column 0
  *first = shift >= 0 ? 0 : (-shift + stride - 1) / stride;
  *last = width - shift <= 0 ? 0 : (width - shift + stride - 1) / stride;
  *first = std::min(*first, width_col);
  *last = std::max(*first, std::min(*last, width_col));
}

}  // namespace

void im2col(const float* data_im, int channels, int height, int width, int ksize, int pad,
            int stride, float* data_col) {
  im2col_rows(data_im, channels, height, width, ksize, pad, stride, 0,
              OutputSize(height, ksize, pad, stride), data_col);
}

void im2col_rows(const float* data_im, int channels, int height, int width, int ksize, int pad,
                 int stride, int row_begin, int row_end, float* data_col) {
  const int height_col = row_end - row_begin;
  const int width_col = OutputSize(width, ksize, pad, stride);
  // Row by row of the image, all kernel columns at once, so that each input
  // row is read from the cache ksize times rather than from memory.
  for (int c_im = 0; c_im < channels; ++c_im) {
    for (int h_offset = 0; h_offset < ksize; ++h_offset) {
      for (int h = 0; h < height_col; ++h) {
        const int h_pad = (row_begin + h) * stride - pad + h_offset;
        const float* row = data_im + (c_im * height + h_pad) * width;
        for (int w_offset = 0; w_offset < ksize; ++w_offset) {
          const int c = (c_im * ksize + h_offset) * ksize + w_offset;
          float* out = data_col + (c * height_col + h) * width_col;
          if (h_pad < 0 || h_pad >= height) {
            std::fill(out, out + width_col, 0.0f);
            continue;
          }
          int first = 0;
          int last = 0;
          InsideColumns(width, width_col, pad, stride, w_offset, &first, &last);
          const int shift = w_offset - pad;
          std::fill(out, out + first, 0.0f);
          if (stride == 1) {
            std::memcpy(out + first, row + first + shift, sizeof(float) * (last - first));
          } else {
            for (int w = first; w < last; ++w) {
              out[w] = row[w * stride + shift];
            }
          }
          std::fill(out + last, out + width_col, 0.0f);
        }
      }
    }
  }
}

void col2im(const float* data_col, int channels, int height, int width, int ksize, int pad,
            int stride, float* data_im) {
  std::fill(data_im, data_im + channels * height * width, 0.0f);
  const int height_col = OutputSize(height, ksize, pad, stride);
  const int width_col = OutputSize(width, ksize, pad, stride);
  const int channels_col = channels * ksize * ksize;
  for (int c = 0; c < channels_col; ++c) {
    const int w_offset = c % ksize;
    const int h_offset = (c / ksize) % ksize;
    const int c_im = c / ksize / ksize;
    int first = 0;
    int last = 0;
    InsideColumns(width, width_col, pad, stride, w_offset, &first, &last);
    for (int h = 0; h < height_col; ++h) {
      const int h_pad = h * stride - pad + h_offset;
      if (h_pad < 0 || h_pad >= height) {
        continue;
      }
      const float* in = data_col + (c * height_col + h) * width_col;
      float* row = data_im + (c_im * height + h_pad) * width;
      const int shift = w_offset - pad;
      for (int w = first; w < last; ++w) {
        row[w * stride + shift] += in[w];
      }
    }
  }
}

}  // namespace nn
