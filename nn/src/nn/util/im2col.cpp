#include <algorithm>
#include <cstring>

#include "nn/util/math_functions.h"

// TAVI_PORTABLE builds the plain loops only; they copy the same values.
#if defined(__SSE__) && !defined(TAVI_PORTABLE)
#define NN_SSE_ROADS 1
#include <xmmintrin.h>
#endif

namespace nn {

namespace {

// to[i] = from[i * stride] for i < n. Strides 2 and 3 (the scan's is 3) take
// four floats from two or three vector loads; as those reach past the group's
// last float, they stop a group before the end: no read passes
// from[(n - 1) * stride].
void CopyStrided(const float* from, int stride, int n, float* to) {
  if (stride == 1) {
    std::memcpy(to, from, sizeof(float) * std::max(n, 0));
    return;
  }
  int i = 0;
#if defined(NN_SSE_ROADS)
  if (stride == 2) {
    for (; i + 5 <= n; i += 4) {
      const __m128 a = _mm_loadu_ps(from + 2 * i);
      const __m128 b = _mm_loadu_ps(from + 2 * i + 4);
      _mm_storeu_ps(to + i, _mm_shuffle_ps(a, b, _MM_SHUFFLE(2, 0, 2, 0)));
    }
  } else if (stride == 3) {
    for (; i + 5 <= n; i += 4) {
      const float* f = from + 3 * i;
      const __m128 a = _mm_loadu_ps(f);      // 0 1 2 3
      const __m128 b = _mm_loadu_ps(f + 4);  // 4 5 6 7
      const __m128 c = _mm_loadu_ps(f + 8);  // 8 9 10 11
      const __m128 bc = _mm_shuffle_ps(b, c, _MM_SHUFFLE(1, 1, 2, 2));  // 6 6 9 9
      _mm_storeu_ps(to + i, _mm_shuffle_ps(a, bc, _MM_SHUFFLE(2, 0, 3, 0)));
    }
  }
#endif
  for (; i < n; ++i) {
    to[i] = from[i * stride];
  }
}

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
  for (int c_im = 0; c_im < channels; ++c_im) {
    for (int h_offset = 0; h_offset < ksize; ++h_offset) {
      for (int w_offset = 0; w_offset < ksize; ++w_offset) {
        const int c = (c_im * ksize + h_offset) * ksize + w_offset;
        float* rows = data_col + c * height_col * width_col;
        // Kernel column w_offset reads at output column w the pixel that
        // w_offset - stride reads at w + 1: its row is that row moved by one,
        // and only its last cell is new. Copying is cheaper than a strided
        // gather.
        const float* earlier =
            stride > 1 && w_offset >= stride ? rows - stride * height_col * width_col : nullptr;
        int first = 0;
        int last = 0;
        InsideColumns(width, width_col, pad, stride, w_offset, &first, &last);
        const int shift = w_offset - pad;
        for (int h = 0; h < height_col; ++h) {
          const int h_pad = (row_begin + h) * stride - pad + h_offset;
          float* out = rows + h * width_col;
          if (h_pad < 0 || h_pad >= height) {
            std::fill(out, out + width_col, 0.0f);
            continue;
          }
          const float* row = data_im + (c_im * height + h_pad) * width;
          if (earlier != nullptr && width_col > 0) {
            CopyStrided(earlier + h * width_col + 1, 1, width_col - 1, out);
            const int w = width_col - 1;
            out[w] = w >= first && w < last ? row[w * stride + shift] : 0.0f;
            continue;
          }
          std::fill(out, out + first, 0.0f);
          CopyStrided(row + first * stride + shift, stride, last - first, out + first);
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
