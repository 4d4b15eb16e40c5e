#ifndef TAVI_SRC_ALIGNMENT_SIFT_PYRAMID_H_
#define TAVI_SRC_ALIGNMENT_SIFT_PYRAMID_H_

#include <cstddef>
#include <cstdint>
#include <vector>

namespace SDMCore {

// A row-major float image with stride = width. Asking for a size the storage
// already covers only changes width and height.
struct FloatImage {
  void resize(uint64_t newWidth, uint64_t newHeight);
  float* row(uint64_t y) { return pixels + y * width; }
  const float* row(uint64_t y) const { return pixels + y * width; }

  uint64_t width = 0;
  uint64_t height = 0;
  float* pixels = nullptr;
  std::vector<float> storage;
};

// The gradient of one pixel with its orientation split between two of eight
// bins: mainWeight goes to mainBin and secondWeight to secondBin, the two
// weights adding up to 1.
struct alignas(16) GradientCell {
  float magnitude;
  float secondWeight;
  float mainWeight;
  uint8_t mainBin;
  uint8_t secondBin;
  uint8_t unused[2];
};
static_assert(sizeof(GradientCell) == 16, "a gradient cell is one 16-byte load");

// Single-precision constants of the orientation arithmetic.
constexpr float kPi = 3.1415925f;
constexpr float kHalfPi = 1.5707963f;
constexpr float kTwoPi = 6.2831855f;

// Fast arctangent of dy / dx (constant 0.28), in [0, kTwoPi).
float fastAngle(float dx, float dy);

// Splits an angle in [0, kTwoPi] between the nearest of eight bins and its
// neighbour; magnitude is stored as given.
GradientCell splitOrientation(float angle, float magnitude);

// The cell of a pixel with central differences dx and dy (no factor 1/2).
GradientCell gradientCell(float dx, float dy);

// An integrated Gaussian of 2r + 1 taps, r = truncate(sigma * 3.5 + 0.5),
// computed in double and normalised to sum 1 in single precision.
std::vector<float> gaussianKernel(float sigma);

// Separable convolution with replicated borders, in single precision: each
// row, then each column, out[i] = sum over j of kernel[j] * in[i + j - radius]
// added in ascending j. kernel has 2 * radius + 1 taps. src and dst must not
// overlap.
void convolveSeparable(const float* src, size_t width, size_t height, const float* kernel,
                       int radius, float* dst);

// One octave of Gaussian levels of a grey image and the upright 128-byte
// descriptors of points on them. Level i has the blur baseSigma * k^i; the
// gradients of a level are computed at its first descriptor and kept.
//
// Calling order: constructor, buildBase, buildLevels, then computeDescriptor.
// Not thread-safe: computeDescriptor fills the gradient cache.
class SiftPyramid {
 public:
  // Levels 0 .. S + 2 of width by height.
  SiftPyramid(uint64_t width, uint64_t height, uint64_t S);

  // pixels: 8-bit grey, stride = width, the size given to the constructor.
  void buildBase(uint64_t width, uint64_t height, const uint8_t* pixels);
  void buildLevels();
  // Builds levels 1 .. highest only (each level depends on the ones below);
  // the others keep what they held. For a caller that knows it needs no more.
  void buildLevels(uint64_t highest);

  // The descriptor of the point (x, y) at level (a whole number in 0 .. S + 2)
  // into out, and norm = the histogram's length before normalisation. When
  // that length is 0.5 or less, norm is 0 and out is left as it was.
  void computeDescriptor(float x, float y, float level, float& norm, uint8_t out[128]);

  uint64_t width() const { return width_; }
  uint64_t height() const { return height_; }
  uint64_t scales() const { return S_; }
  float sigmaRatio() const { return k_; }
  const FloatImage& level(size_t i) const { return levels_[i]; }

  // The bin width in pixels at a level: k^level * baseSigma * binSigmas.
  float binWidth(int level) const;
  // The sampling radius at a level.
  int radius(int level) const;

  // Fills the gradient cells of a level unless done before.
  void ensureGradient(int level);
  // Whether ensureGradient has filled a level.
  bool hasGradient(size_t level) const { return !gradients_[level].empty(); }

  // Chooses the eight-lane (AVX2) histogram loop where the processor has it,
  // or the four-lane one; both give the same bytes. Returns whether the wide
  // loop is on. For tests: process-wide and not thread-safe.
  static bool setWideHistogramRows(bool enabled);

  static constexpr float kBaseSigmaIn = 0.5f;
  static constexpr float kBaseSigma = 0.8f;
  static constexpr float kBinSigmas = 4.0f;
  static constexpr float kClampValue = 0.2f;

  // A gradient cell as the histogram uses it: the main bin's weighted
  // magnitude and the ratio of the second bin's weight to the main one's, both
  // computed once per pixel. 16 bytes, one aligned load.
  struct alignas(16) SampleCell {
    float weight;  // magnitude * mainWeight
    float ratio;   // secondWeight / (mainWeight + 0.000001)
    uint8_t mainBin;
    uint8_t secondBin;
    uint8_t unused[6];
  };
  static_assert(sizeof(SampleCell) == 16, "a sample cell is one 16-byte load");

 private:

  uint64_t width_;
  uint64_t height_;
  uint64_t octaves_ = 1;
  uint64_t S_;
  bool upsampled_ = false;
  std::vector<FloatImage> levels_;
  // Gradient levels, width by height each, empty until first needed.
  std::vector<std::vector<SampleCell>> gradients_;
  float k_;
  // Per-descriptor scratch, kept to spare the allocations.
  std::vector<int64_t> scratchDx_;
  std::vector<int> scratchColumn_;
  std::vector<float> scratchAcross_;
};

}  // namespace SDMCore

#endif  // TAVI_SRC_ALIGNMENT_SIFT_PYRAMID_H_
