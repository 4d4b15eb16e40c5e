#ifndef TAVI_SRC_DETECTOR_WINDOW_H_
#define TAVI_SRC_DETECTOR_WINDOW_H_

#include <cstdint>

namespace tavilib {

// A candidate face box, passed by value through every step of the cascade.
// Coordinates stay integers: each change of frame truncates toward zero, and
// trained thresholds depend on that.
struct Window {
  int32_t x;
  int32_t y;
  int32_t width;
  int32_t height;
  // Probability given by the last net that graded the window.
  float score;
  // Pyramid level the window was born in; carried along for inspection.
  int32_t level;
};

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_WINDOW_H_
