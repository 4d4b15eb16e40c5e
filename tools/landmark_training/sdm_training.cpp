#include "landmark_training/sdm_training.h"

#include <cblas.h>
#include <glog/logging.h>
#include <lapacke.h>

#include <algorithm>
#include <cmath>
#include <numeric>

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

namespace {

// Sums over some rows of centred features X and targets Y: X'X (upper
// triangle), X'Y, and the column sums of X and of Y.
struct RowMoments {
  size_t rows = 0;
  std::vector<double> gram;
  std::vector<double> moment;
  std::vector<double> featureSum;
  std::vector<double> targetSum;

  RowMoments& operator+=(const RowMoments& other) {
    rows += other.rows;
    for (size_t i = 0; i < gram.size(); ++i) gram[i] += other.gram[i];
    for (size_t i = 0; i < moment.size(); ++i) moment[i] += other.moment[i];
    for (size_t c = 0; c < featureSum.size(); ++c) featureSum[c] += other.featureSum[c];
    for (size_t q = 0; q < targetSum.size(); ++q) targetSum[q] += other.targetSum[q];
    return *this;
  }
};

RowMoments momentsOf(const float* features, const float* targets, size_t rows, size_t columns,
                     size_t outputs) {
  const int n = static_cast<int>(rows);
  const int d = static_cast<int>(columns);
  const int k = static_cast<int>(outputs);
  RowMoments moments;
  moments.rows = rows;
  std::vector<float> gram(columns * columns, 0.0f);
  cblas_ssyrk(CblasRowMajor, CblasUpper, CblasTrans, d, n, 1.0f, features, d, 0.0f, gram.data(), d);
  moments.gram.assign(gram.begin(), gram.end());
  std::vector<float> moment(columns * outputs, 0.0f);
  cblas_sgemm(CblasRowMajor, CblasTrans, CblasNoTrans, d, k, n, 1.0f, features, d, targets, k,
              0.0f, moment.data(), k);
  moments.moment.assign(moment.begin(), moment.end());
  moments.featureSum.assign(columns, 0.0);
  moments.targetSum.assign(outputs, 0.0);
  for (size_t r = 0; r < rows; ++r) {
    for (size_t c = 0; c < columns; ++c) moments.featureSum[c] += features[r * columns + c];
    for (size_t q = 0; q < outputs; ++q) moments.targetSum[q] += targets[r * outputs + q];
  }
  return moments;
}

// The ridge regression of the rows that all holds and part does not: the
// moments are recentred on those rows' own means. Returns the projection;
// featureMean and targetMean get those means (relative to the centring).
mp::matrix solveWithout(const RowMoments& all, const RowMoments* part, double ridge,
                        std::vector<double>* featureMean, std::vector<double>* targetMean) {
  const size_t d = all.featureSum.size();
  const size_t k = all.targetSum.size();
  const size_t n = all.rows - (part ? part->rows : 0);
  std::vector<double> a(all.gram);
  std::vector<double> b(all.moment);
  featureMean->assign(d, 0.0);
  targetMean->assign(k, 0.0);
  for (size_t c = 0; c < d; ++c) {
    (*featureMean)[c] = (all.featureSum[c] - (part ? part->featureSum[c] : 0.0)) / static_cast<double>(n);
  }
  for (size_t q = 0; q < k; ++q) {
    (*targetMean)[q] = (all.targetSum[q] - (part ? part->targetSum[q] : 0.0)) / static_cast<double>(n);
  }
  const double count = static_cast<double>(n);
  for (size_t i = 0; i < d; ++i) {
    const double mi = (*featureMean)[i];
    for (size_t j = i; j < d; ++j) {
      a[i * d + j] -= (part ? part->gram[i * d + j] : 0.0) + count * mi * (*featureMean)[j];
    }
    for (size_t q = 0; q < k; ++q) {
      b[i * k + q] -= (part ? part->moment[i * k + q] : 0.0) + count * mi * (*targetMean)[q];
    }
    a[i * d + i] += ridge * count;
  }
  const lapack_int info = LAPACKE_dposv(LAPACK_ROW_MAJOR, 'U', static_cast<lapack_int>(d),
                                        static_cast<lapack_int>(k), a.data(),
                                        static_cast<lapack_int>(d), b.data(),
                                        static_cast<lapack_int>(k));
  CHECK_EQ(info, 0) << "The ridge regression's normal equations are not positive definite.";
  mp::matrix projection(static_cast<int>(d), static_cast<int>(k));
  for (size_t i = 0; i < b.size(); ++i) projection.data()[i] = static_cast<float>(b[i]);
  return projection;
}

// steps of rows [begin, end): targetMean + (x - featureMean) projection, x
// being the centred features.
void addSteps(const float* features, size_t rows, size_t columns, const mp::matrix& projection,
              const std::vector<double>& featureMean, const std::vector<double>& targetMean,
              float* steps) {
  const size_t k = targetMean.size();
  cblas_sgemm(CblasRowMajor, CblasNoTrans, CblasNoTrans, static_cast<int>(rows),
              static_cast<int>(k), static_cast<int>(columns), 1.0f, features,
              static_cast<int>(columns), projection.data(), static_cast<int>(k), 0.0f, steps,
              static_cast<int>(k));
  std::vector<float> offset(k);
  for (size_t q = 0; q < k; ++q) {
    double meanStep = 0.0;
    for (size_t c = 0; c < columns; ++c) meanStep += featureMean[c] * projection.data()[c * k + q];
    offset[q] = static_cast<float>(targetMean[q] - meanStep);
  }
  for (size_t r = 0; r < rows; ++r) {
    for (size_t q = 0; q < k; ++q) steps[r * k + q] += offset[q];
  }
}

}  // namespace

std::vector<float> fitStage(std::vector<float>& features, const std::vector<float>& targets,
                            const std::vector<size_t>& foldEnds, size_t columns, size_t outputs,
                            double ridge, mp::pca_map* map, mp::matrix* bias) {
  const size_t rows = foldEnds.back();
  const double n = static_cast<double>(rows);
  map->mean = mp::matrix(1, static_cast<int>(columns));
  std::vector<double> sums(columns, 0.0);
  for (size_t r = 0; r < rows; ++r) {
    for (size_t c = 0; c < columns; ++c) sums[c] += features[r * columns + c];
  }
  for (size_t c = 0; c < columns; ++c) map->mean.data()[c] = static_cast<float>(sums[c] / n);
  for (size_t r = 0; r < rows; ++r) {
    for (size_t c = 0; c < columns; ++c) features[r * columns + c] -= map->mean.data()[c];
  }
  *bias = mp::matrix(1, static_cast<int>(outputs));
  for (size_t r = 0; r < rows; ++r) {
    for (size_t q = 0; q < outputs; ++q) bias->data()[q] += targets[r * outputs + q] / static_cast<float>(n);
  }
  std::vector<float> centredTargets(targets);
  for (size_t r = 0; r < rows; ++r) {
    for (size_t q = 0; q < outputs; ++q) centredTargets[r * outputs + q] -= bias->data()[q];
  }

  std::vector<RowMoments> folds;
  RowMoments all;
  for (size_t f = 0, begin = 0; f < foldEnds.size(); begin = foldEnds[f++]) {
    folds.push_back(momentsOf(features.data() + begin * columns,
                              centredTargets.data() + begin * outputs, foldEnds[f] - begin, columns,
                              outputs));
    if (f == 0) {
      all = folds[0];
    } else {
      all += folds[f];
    }
  }
  std::vector<double> featureMean;
  std::vector<double> targetMean;
  map->projection = solveWithout(all, nullptr, ridge, &featureMean, &targetMean);

  // Each fold's rows step as a model fit without them would step them.
  std::vector<float> steps(rows * outputs);
  const bool heldOut = foldEnds.size() > 1;
  for (size_t f = 0, begin = 0; f < foldEnds.size(); begin = foldEnds[f++]) {
    const mp::matrix projection =
        heldOut ? solveWithout(all, &folds[f], ridge, &featureMean, &targetMean) : map->projection;
    addSteps(features.data() + begin * columns, foldEnds[f] - begin, columns, projection,
             featureMean, targetMean, steps.data() + begin * outputs);
    for (size_t r = begin; r < foldEnds[f]; ++r) {
      for (size_t q = 0; q < outputs; ++q) steps[r * outputs + q] += bias->data()[q];
    }
  }
  return steps;
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

  // Samples in order of their fold, so that each fold's rows lie together.
  std::vector<size_t> order(samples.size());
  std::iota(order.begin(), order.end(), size_t{0});
  const auto foldOf = [&](size_t s) { return samples[s].person % static_cast<size_t>(settings.folds); };
  std::stable_sort(order.begin(), order.end(), [&](size_t a, size_t b) { return foldOf(a) < foldOf(b); });
  std::vector<size_t> foldEnds;
  for (size_t i = 0; i < order.size(); ++i) {
    if (i + 1 == order.size() || foldOf(order[i + 1]) != foldOf(order[i])) {
      foldEnds.push_back((i + 1) * kStarts);
    }
  }

  // Every sample's nine starts, in the pixels of its normalised image.
  std::vector<std::vector<float>> shapes;
  for (const size_t s : order) {
    for (std::vector<float>& start : SDMCore::startShapes(model.meanShape, samples[s].faceRect)) {
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
    training::forEachItem(order.size(), 2, [&](size_t s, size_t) {
      const LandmarkSample& sample = samples[order[s]];
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
    const std::vector<float> steps =
        fitStage(features, targets, foldEnds, columns, length, settings.ridge,
                 &model.stageMaps.back(), &model.stageBiases.back());
    // Biases apply only beside a non-empty list of stage matrices.
    model.stageMatrices.emplace_back(1, 1);
    double error = 0.0;
    for (size_t i = 0; i < rows; ++i) {
      for (size_t q = 0; q < length; ++q) shapes[i][q] += steps[i * length + q];
      error += normalisedError(shapes[i], samples[order[i / kStarts]].truth);
    }
    report(static_cast<int>(stage), error / static_cast<double>(rows));
  }
  return model;
}

}  // namespace landmarks
