#ifndef TAVI_SRC_ALIGNMENT_SDM_REGRESSION_H_
#define TAVI_SRC_ALIGNMENT_SDM_REGRESSION_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <vector>

#include <opencv2/core.hpp>

#include "alignment/sdm_model.h"
#include "alignment/sift_pyramid.h"
#include "mp/matrix.h"
#include "mp/pca_map.h"

namespace SDMCore {

// A shape is a flat list x0, y0, x1, y1, ...

// The training side's base; it adds nothing that alignment needs.
class TrainUnit {
 protected:
  TrainUnit() = default;
  TrainUnit(const TrainUnit&) = default;
  TrainUnit& operator=(const TrainUnit&) = default;
  ~TrainUnit() = default;
};

// One face on its way through the regression: its grey image, the face box in
// that image's pixels, and the shapes that are scaled along with the image.
class GeneralUnit : public TrainUnit {
 public:
  // Forwards to normalizeImage.
  virtual void normalize(int width);
  // scale = width / faceRect.width; the image is resized bilinearly by scale
  // on both axes (sizes truncated), both shapes are multiplied by scale, and
  // scaleFaceRect follows.
  virtual void normalizeImage(int width);
  // Each field of faceRect becomes truncate(field * scale).
  virtual void scaleFaceRect();
  // Divides both shapes by scale.
  virtual void restoreShapes();
  virtual ~GeneralUnit() = default;

  // 8-bit single-channel.
  cv::Mat image;
  cv::Rect faceRect;
  // Scaled along with the image; empty in every flow of the library.
  std::vector<float> referenceShape;
  // The factor of the last normalizeImage.
  float scale = 1.0f;
  std::vector<float> resultShape;
};

// The landmarks of the unit's face with the process-wide model, in the
// coordinates of the unit's image as it was before normalisation.
// REQUIRES: sdmModel is loaded; unit.image is grey and unit.faceRect set.
std::vector<float> fitFace(GeneralUnit& unit);
// The same with a given model.
std::vector<float> fitFace(const SDMModel& model, GeneralUnit& unit);

// A shape in units of the face box (0, 0 its top left, 1, 1 its bottom right)
// in pixels: x = width * ux + x0, y = height * uy + y0.
std::vector<float> placeShape(const std::vector<float>& unitShape, const cv::Rect& faceRect);

// The nine starts: the mean shape placed in the box, then the mean shape moved
// by a tenth of the box to (a, b) = (-1,-1), (-1,0), (-1,1), (0,-1), (0,1),
// (1,-1), (1,0), (1,1).
std::vector<std::vector<float>> startShapes(const std::vector<float>& meanShape,
                                            const cv::Rect& faceRect);

// The padding the regression gives image for shape: at least 40 % of the
// width, more if a point lies further outside. padded is the image with that
// many black pixels on all four sides, or image itself when the padding is 0.
int padForShape(const cv::Mat& image, const std::vector<float>& shape, cv::Mat& padded);

// The descriptors of shapes on one face, as the regression computes them:
// the image padded for the first start, its descriptor pyramid, and one
// 128-byte buffer for every descriptor of the face (a point whose descriptor
// is left unchanged repeats the bytes of the one computed before it, also
// across shapes and stages). The trainers compute their features here too.
class FaceFeatures {
 public:
  // Builds the pyramid with scalesPerOctave scales per octave and its levels
  // up to highestLevel.
  FaceFeatures(const cv::Mat& image, const std::vector<float>& start, int32_t scalesPerOctave,
               int32_t highestLevel);
  // The padding on each side; shapes given to compute are in padded pixels.
  int pad() const { return pad_; }
  // The feature row of the shape at a pyramid level: each point's
  // descriptor bytes divided by 256, 128 floats a point. Returns whether the
  // first point kept the buffer's bytes, that is whether the row depends on
  // what was computed before it.
  bool compute(const std::vector<float>& paddedShape, int32_t level, float* feature);

  // The shared buffer: the bytes a point without usable gradients repeats.
  // Zero until the first descriptor.
  using Descriptor = std::array<uint8_t, 128>;
  const Descriptor& buffer() const { return descriptor_; }
  void setBuffer(const Descriptor& bytes) { descriptor_ = bytes; }

 private:
  cv::Mat padded_;
  int pad_;
  SiftPyramid pyramid_;
  Descriptor descriptor_ = {};
};

// The highest pyramid level that a stage of the model reads.
int32_t highestStageLevel(const SDMModel& model);

// Runs every start through all stages of model on image and returns the
// coordinate-wise median of the results, in image's pixels. All starts take a
// stage together, in one product; the result is that of running the starts
// one after the other (regressShapesOneByOne) up to the order of summation
// inside the products.
std::vector<float> regressShapes(const SDMModel& model, const cv::Mat& image,
                                 const std::vector<std::vector<float>>& starts);

// The same, each start through all stages before the next: the reference the
// batched road is measured against.
std::vector<float> regressShapesOneByOne(const SDMModel& model, const cv::Mat& image,
                                         const std::vector<std::vector<float>>& starts);

// One stage in place: shape += bias + (feature - map.mean) * map.projection,
// the bias only if it has exactly as many elements as the shape.
// REQUIRES: feature has map.mean.columns() floats, and map.projection has that
//   many rows and at most shape.size() columns.
void applyStage(const float* feature, const mp::pca_map& map, const mp::matrix& bias,
                std::vector<float>& shape);
// The same for several shapes at once, one feature row each (rows of
// map.mean.columns() floats, one after the other), in one product.
void applyStage(const float* features, const mp::pca_map& map, const mp::matrix& bias,
                std::vector<float>* shapes, size_t count);

// For each coordinate, the value at position n / 2 of the n shapes' values in
// ascending order; x and y are taken apart.
std::vector<float> coordinateMedian(const std::vector<std::vector<float>>& shapes);

}  // namespace SDMCore

#endif  // TAVI_SRC_ALIGNMENT_SDM_REGRESSION_H_
