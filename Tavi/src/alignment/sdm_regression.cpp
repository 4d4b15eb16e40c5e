#include "alignment/sdm_regression.h"

#include <algorithm>
#include <cstdint>

#include <opencv2/imgproc.hpp>

#include "alignment/sift_pyramid.h"
#include "nn/util/math_functions.h"

namespace SDMCore {
namespace {

// The pyramid level of stage i: its entry of stageLevels, or the list's last
// entry past its end (0 for an empty list).
int32_t stageLevel(const SDMModel& model, size_t i) {
  if (i < model.stageLevels.size()) return model.stageLevels[i];
  if (!model.stageLevels.empty()) return model.stageLevels.back();
  return 0;
}

}  // namespace

void GeneralUnit::normalize(int width) { normalizeImage(width); }

void GeneralUnit::normalizeImage(int width) {
  scale = static_cast<float>(width) / static_cast<float>(faceRect.width);
  const cv::Size size(static_cast<int>(static_cast<float>(image.cols) * scale),
                      static_cast<int>(static_cast<float>(image.rows) * scale));
  // The size is given, so the factors beside it play no part.
  cv::resize(image, image, size, 0, 0, cv::INTER_LINEAR);
  for (float& v : referenceShape) v *= scale;
  for (float& v : resultShape) v *= scale;
  scaleFaceRect();
}

void GeneralUnit::scaleFaceRect() {
  faceRect.x = static_cast<int>(static_cast<float>(faceRect.x) * scale);
  faceRect.y = static_cast<int>(static_cast<float>(faceRect.y) * scale);
  faceRect.width = static_cast<int>(static_cast<float>(faceRect.width) * scale);
  faceRect.height = static_cast<int>(static_cast<float>(faceRect.height) * scale);
}

void GeneralUnit::restoreShapes() {
  for (float& v : referenceShape) v /= scale;
  for (float& v : resultShape) v /= scale;
}

std::vector<float> placeShape(const std::vector<float>& unitShape, const cv::Rect& faceRect) {
  std::vector<float> shape(unitShape.size());
  const float width = static_cast<float>(faceRect.width);
  const float height = static_cast<float>(faceRect.height);
  const float x0 = static_cast<float>(faceRect.x);
  const float y0 = static_cast<float>(faceRect.y);
  for (size_t i = 0; i + 1 < unitShape.size(); i += 2) {
    shape[i] = width * unitShape[i] + x0;
    shape[i + 1] = height * unitShape[i + 1] + y0;
  }
  return shape;
}

std::vector<std::vector<float>> startShapes(const std::vector<float>& meanShape,
                                            const cv::Rect& faceRect) {
  std::vector<std::vector<float>> starts;
  starts.push_back(placeShape(meanShape, faceRect));
  for (int e = 0; e < 1; ++e) {
    const float f = static_cast<float>(e) * 0.05f + 1.0f;
    for (int a = -1; a <= 1; ++a) {
      for (int b = -1; b <= 1; ++b) {
        if (a == 0 && b == 0) continue;
        std::vector<float> moved(meanShape.size());
        for (size_t i = 0; i + 1 < meanShape.size(); i += 2) {
          moved[i] = (meanShape[i] - 0.5f) * f + 0.5f + static_cast<float>(a) * 0.1f;
          moved[i + 1] = (meanShape[i + 1] - 0.5f) * f + 0.5f + static_cast<float>(b) * 0.1f;
        }
        starts.push_back(placeShape(moved, faceRect));
      }
    }
  }
  return starts;
}

int padForShape(const cv::Mat& image, const std::vector<float>& shape, cv::Mat& padded) {
  const int columns = image.cols;
  const int rows = image.rows;
  int pad = static_cast<int>(static_cast<double>(columns) * 0.4);
  for (size_t i = 0; i + 1 < shape.size(); i += 2) {
    const float x = shape[i];
    const float y = shape[i + 1];
    float need = 0.0f;
    if (x < 0.0f || y < 0.0f) {
      need = std::max(-x, -y);
    } else if (x >= static_cast<float>(columns) || y >= static_cast<float>(rows)) {
      need = std::max(x - static_cast<float>(columns) + 1.0f, y - static_cast<float>(rows) + 1.0f);
    } else {
      continue;
    }
    pad = std::max(pad, static_cast<int>(need));
  }
  if (pad < 1) {
    padded = image;
  } else {
    cv::copyMakeBorder(image, padded, pad, pad, pad, pad, cv::BORDER_CONSTANT, cv::Scalar(0));
  }
  return pad;
}

void applyStage(const float* feature, const mp::pca_map& map, const mp::matrix& bias,
                std::vector<float>& shape) {
  applyStage(feature, map, bias, &shape, 1);
}

void applyStage(const float* features, const mp::pca_map& map, const mp::matrix& bias,
                std::vector<float>* shapes, size_t count) {
  if (count == 0) return;
  const int D = map.mean.columns();
  const int K = map.projection.columns();
  const size_t rowLength = static_cast<size_t>(std::max(D, 0));
  std::vector<float> tmp(count * rowLength);
  for (size_t r = 0; r < count; ++r) {
    nn::vsSub(D, features + r * rowLength, map.mean.data(), tmp.data() + r * rowLength);
  }
  const size_t stride = std::max(shapes[0].size(), static_cast<size_t>(std::max(K, 0)));
  std::vector<float> delta(count * stride, 0.0f);
  // An empty map leaves delta at zero, which the product would give too.
  if (D > 0 && K > 0) {
    cblas_sgemm(CblasRowMajor, CblasNoTrans, CblasNoTrans, static_cast<int>(count), K, D, 1.0f,
                tmp.data(), D, map.projection.data(), K, 0.0f, delta.data(), static_cast<int>(stride));
  }
  for (size_t r = 0; r < count; ++r) {
    std::vector<float>& shape = shapes[r];
    const float* d = delta.data() + r * stride;
    const bool withBias =
        bias.data() != nullptr && bias.size() == static_cast<int64_t>(shape.size());
    for (size_t q = 0; q < shape.size(); ++q) {
      if (withBias) {
        shape[q] += bias.data()[q] + d[q];
      } else {
        shape[q] += d[q];
      }
    }
  }
}

std::vector<float> coordinateMedian(const std::vector<std::vector<float>>& shapes) {
  std::vector<float> result = shapes.at(0);
  std::vector<float> values(shapes.size());
  for (size_t q = 0; q < result.size(); ++q) {
    for (size_t s = 0; s < shapes.size(); ++s) values[s] = shapes[s][q];
    std::sort(values.begin(), values.end());
    result[q] = values[values.size() / 2];
  }
  return result;
}

FaceFeatures::FaceFeatures(const cv::Mat& image, const std::vector<float>& start,
                           int32_t scalesPerOctave, int32_t highestLevel)
    : pad_(padForShape(image, start, padded_)),
      pyramid_(static_cast<uint64_t>(padded_.cols), static_cast<uint64_t>(padded_.rows),
               static_cast<uint64_t>(scalesPerOctave)) {
  if (!padded_.isContinuous()) padded_ = padded_.clone();
  pyramid_.buildBase(static_cast<uint64_t>(padded_.cols), static_cast<uint64_t>(padded_.rows),
                     padded_.ptr<uint8_t>(0));
  pyramid_.buildLevels(static_cast<uint64_t>(
      std::min<int64_t>(highestLevel, static_cast<int64_t>(scalesPerOctave) + 2)));
}

bool FaceFeatures::compute(const std::vector<float>& paddedShape, int32_t level, float* feature) {
  bool firstKept = false;
  for (size_t j = 0; j < paddedShape.size() / 2; ++j) {
    float norm = 0.0f;
    pyramid_.computeDescriptor(paddedShape[2 * j], paddedShape[2 * j + 1],
                               static_cast<float>(level), norm, descriptor_.data());
    if (j == 0) firstKept = norm == 0.0f;
    float* row = feature + j * 128;
    for (int t = 0; t < 128; ++t) row[t] = static_cast<float>(descriptor_[t]) * 0.00390625f;
  }
  return firstKept;
}

int32_t highestStageLevel(const SDMModel& model) {
  // Only the levels some stage asks for are blurred; the others would not be
  // read.
  int32_t highest = 0;
  for (size_t i = 0; i < model.stageMaps.size(); ++i) highest = std::max(highest, stageLevel(model, i));
  return highest;
}

namespace {

const mp::matrix& stageBias(const SDMModel& model, size_t i) {
  static const mp::matrix noBias;
  const bool useBiases = !model.stageMatrices.empty() && !model.stageBiases.empty();
  return useBiases && i < model.stageBiases.size() ? model.stageBiases[i] : noBias;
}

// Each shape (in padded pixels) through all stages before the next, one
// descriptor buffer for the face.
void regressOneByOne(const SDMModel& model, FaceFeatures& features,
                     std::vector<std::vector<float>>& shapes) {
  std::vector<float> feature(model.meanShape.size() / 2 * 128);
  for (std::vector<float>& shape : shapes) {
    for (size_t i = 0; i < model.stageMaps.size(); ++i) {
      features.compute(shape, stageLevel(model, i), feature.data());
      applyStage(feature.data(), model.stageMaps[i], stageBias(model, i), shape);
    }
  }
}

// All shapes through one stage after the other, one product a stage. Each
// row starts from the buffer the one-by-one order would hand it: what the
// same shape left at the stage before. At stage 0 that order hands a shape
// the buffer of the previous shape's last stage, not known yet; false if a
// row depends on it (its first point kept the buffer), and then the shapes
// are half-way and must be started again.
bool regressTogether(const SDMModel& model, FaceFeatures& features,
                     std::vector<std::vector<float>>& shapes) {
  const size_t rowLength = model.meanShape.size() / 2 * 128;
  std::vector<float> rows(shapes.size() * rowLength);
  std::vector<FaceFeatures::Descriptor> carried(shapes.size(), FaceFeatures::Descriptor{});
  for (size_t i = 0; i < model.stageMaps.size(); ++i) {
    for (size_t k = 0; k < shapes.size(); ++k) {
      features.setBuffer(carried[k]);
      const bool dependsOnBefore =
          features.compute(shapes[k], stageLevel(model, i), rows.data() + k * rowLength);
      if (dependsOnBefore && i == 0 && k > 0) return false;
      carried[k] = features.buffer();
    }
    applyStage(rows.data(), model.stageMaps[i], stageBias(model, i), shapes.data(), shapes.size());
  }
  return true;
}

std::vector<std::vector<float>> paddedStarts(const std::vector<std::vector<float>>& starts,
                                             float padding) {
  std::vector<std::vector<float>> shapes = starts;
  for (std::vector<float>& shape : shapes) {
    for (float& v : shape) v += padding;
  }
  return shapes;
}

std::vector<float> unpaddedMedian(const std::vector<std::vector<float>>& shapes, float padding) {
  std::vector<float> result = coordinateMedian(shapes);
  for (float& v : result) v -= padding;
  return result;
}

}  // namespace

std::vector<float> regressShapes(const SDMModel& model, const cv::Mat& image,
                                 const std::vector<std::vector<float>>& starts) {
  FaceFeatures features(image, starts.at(0), model.scalesPerOctave, highestStageLevel(model));
  const float padding = static_cast<float>(features.pad());
  std::vector<std::vector<float>> shapes = paddedStarts(starts, padding);
  if (!regressTogether(model, features, shapes)) {
    shapes = paddedStarts(starts, padding);
    features.setBuffer(FaceFeatures::Descriptor{});
    regressOneByOne(model, features, shapes);
  }
  return unpaddedMedian(shapes, padding);
}

std::vector<float> regressShapesOneByOne(const SDMModel& model, const cv::Mat& image,
                                         const std::vector<std::vector<float>>& starts) {
  FaceFeatures features(image, starts.at(0), model.scalesPerOctave, highestStageLevel(model));
  const float padding = static_cast<float>(features.pad());
  std::vector<std::vector<float>> shapes = paddedStarts(starts, padding);
  regressOneByOne(model, features, shapes);
  return unpaddedMedian(shapes, padding);
}

std::vector<float> fitFace(const SDMModel& model, GeneralUnit& unit) {
  unit.normalize(model.faceWidth);
  const std::vector<std::vector<float>> starts = startShapes(model.meanShape, unit.faceRect);
  // referenceShape stays beside the result; the regression takes no notice of it.
  unit.resultShape = regressShapes(model, unit.image, starts);
  unit.restoreShapes();
  return unit.resultShape;
}

std::vector<float> fitFace(GeneralUnit& unit) { return fitFace(*sdmModel, unit); }

}  // namespace SDMCore
