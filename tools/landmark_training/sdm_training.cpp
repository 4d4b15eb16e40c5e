#include "landmark_training/sdm_training.h"

#include <cblas.h>
#include <glog/logging.h>
#include <lapacke.h>

#include <cmath>

#include "alignment/sdm_regression.h"
#include "detector_training/parallel_items.h"

namespace landmarks {

namespace {

constexpr int kDescriptorLength = 128;
constexpr int kStarts = 9;

std::vector<float> unitMeanShape(const std::vector<LandmarkSample>& samples) {
  std::vector<double> sum(samples[0].truth.size(), 0.0);
  for (const LandmarkSample& sample : samples) {
    const cv::Rect& box = sample.faceRect;
    for (size_t k = 0; k + 1 < sum.size(); k += 2) {
      sum[k] += (sample.truth[k] - static_cast<float>(box.x)) / static_cast<float>(box.width);
      sum[k + 1] += (sample.truth[k + 1] - static_cast<float>(box.y)) / static_cast<float>(box.height);
    }
  }
  std::vector<float> mean(sum.size());
  for (size_t k = 0; k < sum.size(); ++k) {
    mean[k] = static_cast<float>(sum[k] / static_cast<double>(samples.size()));
  }
  return mean;
}

}  // namespace

double normalisedError(const std::vector<float>& shape, const std::vector<float>& truth) {
  const double eyes = std::hypot(truth[2 * 36] - truth[2 * 45], truth[2 * 36 + 1] - truth[2 * 45 + 1]);
  double sum = 0.0;
  for (size_t k = 0; k + 1 < truth.size(); k += 2) {
    sum += std::hypot(shape[k] - truth[k], shape[k + 1] - truth[k + 1]);
  }
  return sum / static_cast<double>(truth.size() / 2) / eyes;
}

void fitStage(std::vector<float>& features, const std::vector<float>& targets, size_t rows,
              size_t columns, size_t outputs, double ridge, mp::pca_map* map, mp::matrix* bias) {
  const int n = static_cast<int>(rows);
  const int d = static_cast<int>(columns);
  const int k = static_cast<int>(outputs);
  map->mean = mp::matrix(1, d);
  std::vector<double> sums(columns, 0.0);
  for (size_t r = 0; r < rows; ++r) {
    const float* row = features.data() + r * columns;
    for (size_t c = 0; c < columns; ++c) sums[c] += row[c];
  }
  for (size_t c = 0; c < columns; ++c) map->mean.data()[c] = static_cast<float>(sums[c] / n);
  for (size_t r = 0; r < rows; ++r) {
    float* row = features.data() + r * columns;
    for (size_t c = 0; c < columns; ++c) row[c] -= map->mean.data()[c];
  }
  *bias = mp::matrix(1, k);
  for (size_t r = 0; r < rows; ++r) {
    for (size_t q = 0; q < outputs; ++q) bias->data()[q] += targets[r * outputs + q] / n;
  }
  std::vector<float> centredTargets(targets);
  for (size_t r = 0; r < rows; ++r) {
    for (size_t q = 0; q < outputs; ++q) centredTargets[r * outputs + q] -= bias->data()[q];
  }
  // The normal equations: Xc' Xc (upper triangle) and Xc' Y.
  std::vector<float> gram(columns * columns, 0.0f);
  cblas_ssyrk(CblasRowMajor, CblasUpper, CblasTrans, d, n, 1.0f, features.data(), d, 0.0f,
              gram.data(), d);
  std::vector<float> moment(columns * outputs, 0.0f);
  cblas_sgemm(CblasRowMajor, CblasTrans, CblasNoTrans, d, k, n, 1.0f, features.data(), d,
              centredTargets.data(), k, 0.0f, moment.data(), k);
  std::vector<double> a(gram.begin(), gram.end());
  std::vector<double> b(moment.begin(), moment.end());
  gram.clear();
  gram.shrink_to_fit();
  for (size_t c = 0; c < columns; ++c) a[c * columns + c] += ridge * n;
  const lapack_int info = LAPACKE_dposv(LAPACK_ROW_MAJOR, 'U', d, k, a.data(), d, b.data(), k);
  CHECK_EQ(info, 0) << "The ridge regression's normal equations are not positive definite.";
  map->projection = mp::matrix(d, k);
  for (size_t i = 0; i < b.size(); ++i) map->projection.data()[i] = static_cast<float>(b[i]);
}

SDMCore::SDMModel trainSdm(const std::vector<LandmarkSample>& samples, const SdmSettings& settings,
                           const StageReport& report) {
  SDMCore::SDMModel model;
  model.stageLevels = settings.stageLevels;
  model.scalesPerOctave = settings.scalesPerOctave;
  model.faceWidth = settings.faceWidth;
  model.meanShape = unitMeanShape(samples);
  const size_t length = model.meanShape.size();
  const size_t columns = length / 2 * kDescriptorLength;

  // Every sample's nine starts, in the pixels of its normalised image.
  std::vector<std::vector<float>> shapes;
  for (const LandmarkSample& sample : samples) {
    for (std::vector<float>& start : SDMCore::startShapes(model.meanShape, sample.faceRect)) {
      shapes.push_back(std::move(start));
    }
  }
  const size_t rows = shapes.size();
  const int32_t highest = *std::max_element(settings.stageLevels.begin(), settings.stageLevels.end());
  for (size_t stage = 0; stage < settings.stageLevels.size(); ++stage) {
    std::vector<float> features(rows * columns);
    std::vector<float> targets(rows * length);
    // Each face's pyramid is built for its first start, as the regression
    // builds it, and serves its nine shapes.
    training::forEachItem(samples.size(), 2, [&](size_t s, size_t) {
      const LandmarkSample& sample = samples[s];
      SDMCore::FaceFeatures faceFeatures(sample.image, shapes[s * kStarts], settings.scalesPerOctave,
                                         highest);
      const float pad = static_cast<float>(faceFeatures.pad());
      for (size_t i = s * kStarts; i < (s + 1) * kStarts; ++i) {
        std::vector<float> padded = shapes[i];
        for (float& v : padded) v += pad;
        faceFeatures.compute(padded, settings.stageLevels[stage], features.data() + i * columns);
        for (size_t q = 0; q < length; ++q) targets[i * length + q] = sample.truth[q] - shapes[i][q];
      }
    });
    model.stageMaps.emplace_back();
    model.stageBiases.emplace_back();
    fitStage(features, targets, rows, columns, length, settings.ridge, &model.stageMaps.back(),
             &model.stageBiases.back());
    // Biases apply only beside a non-empty list of stage matrices.
    model.stageMatrices.emplace_back(1, 1);
    // The features are centred now: the step is bias + features * projection.
    std::vector<float> steps(rows * length);
    cblas_sgemm(CblasRowMajor, CblasNoTrans, CblasNoTrans, static_cast<int>(rows),
                static_cast<int>(length), static_cast<int>(columns), 1.0f, features.data(),
                static_cast<int>(columns), model.stageMaps.back().projection.data(),
                static_cast<int>(length), 0.0f, steps.data(), static_cast<int>(length));
    double error = 0.0;
    for (size_t i = 0; i < rows; ++i) {
      for (size_t q = 0; q < length; ++q) {
        shapes[i][q] += model.stageBiases.back().data()[q] + steps[i * length + q];
      }
      error += normalisedError(shapes[i], samples[i / kStarts].truth);
    }
    report(static_cast<int>(stage), error / static_cast<double>(rows));
  }
  return model;
}

}  // namespace landmarks
