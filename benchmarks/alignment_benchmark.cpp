// Cost of one align68Points call on a 640x480 image with a model of real
// dimensions (68 points, 5 stages, maps of random numbers), and of its parts:
// the resize to the working frame, the pyramid, the descriptors and the
// regression products. Run single-threaded:
//
//   OPENBLAS_NUM_THREADS=1 build/benchmarks/alignment_benchmark
//
// BM_Align68PointsBreakdown runs the same road as align68Points from the
// library's pieces, timing each, and reports each part's share of the whole.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <random>
#include <string>
#include <vector>

#include <unistd.h>

#include <opencv2/core.hpp>
#include <opencv2/imgproc.hpp>

#include "alignment/resize_antialias.h"
#include "alignment/sdm_model.h"
#include "alignment/sdm_regression.h"
#include "alignment/sift_pyramid.h"
#include "mp/matrix.h"
#include "mp/pca_map.h"
#include "nn/util/math_functions.h"
#include "tavilib.h"

namespace {

constexpr int kPoints = 68;
constexpr int kStages = 5;
constexpr int kFeature = kPoints * 128;

// A face-like mean shape in box units.
std::vector<float> MeanShape() {
  std::vector<float> shape;
  auto add = [&shape](float x, float y) {
    shape.push_back(x);
    shape.push_back(y);
  };
  for (int i = 0; i < 17; ++i) add(0.1f + 0.05f * i, 0.45f + 0.4f * (1.0f - ((i - 8) * (i - 8)) / 64.0f));
  for (int i = 0; i < 10; ++i) add(0.2f + 0.065f * i, 0.3f);
  for (int i = 0; i < 9; ++i) add(0.5f, 0.35f + 0.03f * i);
  for (int i = 0; i < 12; ++i) add((i < 6 ? 0.3f : 0.6f) + 0.02f * (i % 6), 0.4f + 0.01f * (i % 3));
  for (int i = 0; i < 20; ++i) add(0.35f + 0.015f * i, 0.75f + 0.005f * (i % 4));
  return shape;
}

// The model file, written with the records' own write, loaded once.
struct Fixture {
  Fixture() {
    std::mt19937 generator(1);
    std::uniform_real_distribution<float> value(-1.0f, 1.0f);
    SDMCore::SDMModel model;
    model.meanShape = MeanShape();
    for (int s = 0; s < kStages; ++s) {
      mp::pca_map map;
      map.mean = mp::matrix(1, kFeature);
      map.projection = mp::matrix(kFeature, 2 * kPoints);
      for (int i = 0; i < kFeature; ++i) map.mean.data()[i] = 0.05f + 0.05f * value(generator);
      // Small enough that the shapes stay on the face.
      for (int64_t i = 0; i < map.projection.size(); ++i) map.projection.data()[i] = 0.003f * value(generator);
      model.stageMaps.push_back(map);
      mp::matrix bias(1, 2 * kPoints);
      for (int q = 0; q < 2 * kPoints; ++q) bias.data()[q] = 0.5f * value(generator);
      model.stageBiases.push_back(bias);
    }
    model.stageMatrices.push_back(mp::matrix(1, 1));
    folder = (std::filesystem::temp_directory_path() /
              ("tavi-alignment-benchmark-" + std::to_string(::getpid())))
                 .string();
    std::filesystem::create_directories(folder);
    {
      std::ofstream out(folder + "/model.sdm", std::ios::binary);
      auto put = [&out](int32_t v) { out.write(reinterpret_cast<const char*>(&v), 4); };
      put(static_cast<int32_t>(model.stageMatrices.size()));
      for (const mp::matrix& m : model.stageMatrices) m.write(out);
      put(static_cast<int32_t>(model.stageBiases.size()));
      for (const mp::matrix& m : model.stageBiases) m.write(out);
      put(static_cast<int32_t>(model.meanShape.size()));
      out.write(reinterpret_cast<const char*>(model.meanShape.data()), model.meanShape.size() * 4);
      put(0);
      put(static_cast<int32_t>(model.stageMaps.size()));
      for (const mp::pca_map& map : model.stageMaps) map.write(out);
      const int32_t levels[] = {2, 2, 1, 1, 0};
      put(5);
      out.write(reinterpret_cast<const char*>(levels), sizeof levels);
      put(0);
      put(1);
      put(3);
      put(100);
    }
    if (tavilib::loadSDMModel(folder, "model.sdm") != tavilib::STATUS_OK) std::abort();
    std::filesystem::remove_all(folder);

    // A 640x480 image with structure at several scales.
    pixels.resize(640 * 480 * 3);
    for (int y = 0; y < 480; ++y) {
      for (int x = 0; x < 640; ++x) {
        for (int c = 0; c < 3; ++c) {
          const double v = 128 + 60 * std::sin(x * (0.05 + 0.01 * c)) * std::cos(y * 0.04) +
                           40 * std::sin((x + 2 * y) * 0.13) + 20 * std::cos((x - y) * 0.31);
          pixels[(static_cast<size_t>(y) * 640 + x) * 3 + c] = static_cast<uint8_t>(std::clamp(v, 0.0, 255.0));
        }
      }
    }
    image = tavilib::Image{640, 480, 0, pixels.data()};
  }

  std::string folder;
  std::vector<uint8_t> pixels;
  tavilib::Image image;
  // A typical detection: 160 by 180 pixels.
  const tavilib::Rectangle<float> rect{240.0f, 140.0f, 400.0f, 320.0f};
};

Fixture& Shared() {
  static Fixture fixture;
  return fixture;
}

// The parts of one face, as align68Points composes them.
struct Face {
  cv::Mat crop;
  float cropX = 0;
  float cropY = 0;
  float scaleX = 1;
  float scaleY = 1;
  cv::Rect faceRect;
};

Face CropFace(const Fixture& f) {
  Face face;
  cv::Mat work(f.image.height, f.image.width, CV_8UC3, f.image.data, f.image.width * 3);
  const float w = f.rect.right - f.rect.left;
  const float h = f.rect.bottom - f.rect.top;
  face.cropX = std::max(f.rect.left - w * 0.5f, 0.0f);
  face.cropY = std::max(f.rect.top - h * 0.5f, 0.0f);
  float right = f.rect.right + w * 0.5f;
  if (!(640.0f > right)) right = 639.0f;
  float bottom = f.rect.bottom + h * 0.5f;
  if (!(480.0f > bottom)) bottom = 479.0f;
  face.crop = work(cv::Rect(static_cast<int>(face.cropX), static_cast<int>(face.cropY),
                            static_cast<int>(right - face.cropX), static_cast<int>(bottom - face.cropY)));
  face.scaleX = 250.0f / face.crop.cols;
  face.scaleY = 250.0f / face.crop.rows;
  const float left = (f.rect.left - face.cropX) * face.scaleX;
  const float top = (f.rect.top - face.cropY) * face.scaleY;
  const int boxW = static_cast<int>((f.rect.right - face.cropX) * face.scaleX - left);
  const int boxH = static_cast<int>((f.rect.bottom - face.cropY) * face.scaleY - top);
  const float a = boxW * 0.1f;
  const float b = boxH * 0.15f;
  face.faceRect = cv::Rect(static_cast<int>(static_cast<int>(left) - static_cast<double>(a) * 0.5),
                           static_cast<int>(static_cast<int>(top) + b), static_cast<int>(a + a + boxW),
                           static_cast<int>(b + b + boxH));
  return face;
}

// Grey working frame normalised to the face width, padded, and its pyramid.
struct Prepared {
  cv::Mat padded;
  int pad = 0;
  std::vector<std::vector<float>> starts;
  float scale = 1;
};

Prepared Prepare(const cv::Mat& frame, const cv::Rect& faceRect) {
  const SDMCore::SDMModel& model = *SDMCore::sdmModel;
  SDMCore::GeneralUnit unit;
  cv::cvtColor(frame, unit.image, cv::COLOR_RGB2GRAY, 0);
  unit.faceRect = faceRect;
  unit.normalize(model.faceWidth);
  Prepared prepared;
  prepared.scale = unit.scale;
  prepared.starts = SDMCore::startShapes(model.meanShape, unit.faceRect);
  prepared.pad = SDMCore::padForShape(unit.image, prepared.starts[0], prepared.padded);
  return prepared;
}

SDMCore::SiftPyramid BuildPyramid(const cv::Mat& padded) {
  SDMCore::SiftPyramid pyramid(padded.cols, padded.rows, SDMCore::sdmModel->scalesPerOctave);
  pyramid.buildBase(padded.cols, padded.rows, padded.ptr<uint8_t>(0));
  // As the regression does: only up to the highest level a stage asks for.
  const std::vector<int32_t>& levels = SDMCore::sdmModel->stageLevels;
  pyramid.buildLevels(*std::max_element(levels.begin(), levels.end()));
  return pyramid;
}

using Clock = std::chrono::steady_clock;
double Seconds(Clock::time_point from, Clock::time_point to) {
  return std::chrono::duration<double>(to - from).count();
}

void BM_Align68Points(benchmark::State& state) {
  Fixture& f = Shared();
  std::vector<float> points;
  for (auto _ : state) {
    tavilib::align68Points(f.image, f.rect, points);
    benchmark::DoNotOptimize(points.data());
  }
}
BENCHMARK(BM_Align68Points)->Unit(benchmark::kMillisecond);

void BM_Resize(benchmark::State& state) {
  const Face face = CropFace(Shared());
  for (auto _ : state) {
    cv::Mat frame = tavilib::resize_antialias(face.crop, cv::Size(250, 250));
    benchmark::DoNotOptimize(frame.data);
  }
}
BENCHMARK(BM_Resize)->Unit(benchmark::kMillisecond);

// Grey conversion, normalisation to the face width, padding, pyramid levels.
void BM_Pyramid(benchmark::State& state) {
  const Face face = CropFace(Shared());
  const cv::Mat frame = tavilib::resize_antialias(face.crop, cv::Size(250, 250));
  for (auto _ : state) {
    const Prepared prepared = Prepare(frame, face.faceRect);
    SDMCore::SiftPyramid pyramid = BuildPyramid(prepared.padded);
    benchmark::DoNotOptimize(&pyramid);
  }
}
BENCHMARK(BM_Pyramid)->Unit(benchmark::kMillisecond);

// The 9 x 5 x 68 descriptors of one face at the start positions, with the
// gradient levels they fill; the pyramid is built outside the timing.
void BM_Descriptors(benchmark::State& state) {
  const Face face = CropFace(Shared());
  const cv::Mat frame = tavilib::resize_antialias(face.crop, cv::Size(250, 250));
  const Prepared prepared = Prepare(frame, face.faceRect);
  const SDMCore::SDMModel& model = *SDMCore::sdmModel;
  uint8_t bytes[128] = {};
  for (auto _ : state) {
    state.PauseTiming();
    SDMCore::SiftPyramid pyramid = BuildPyramid(prepared.padded);
    state.ResumeTiming();
    for (const std::vector<float>& start : prepared.starts) {
      for (int s = 0; s < kStages; ++s) {
        for (int j = 0; j < kPoints; ++j) {
          float norm = 0;
          pyramid.computeDescriptor(start[2 * j] + prepared.pad, start[2 * j + 1] + prepared.pad,
                                    static_cast<float>(model.stageLevels[s]), norm, bytes);
        }
      }
    }
    benchmark::DoNotOptimize(bytes);
  }
}
BENCHMARK(BM_Descriptors)->Unit(benchmark::kMillisecond);

// The 45 stage updates of one face (9 starts x 5 stages), each one product of
// a feature row with a 8704 x 136 map.
void BM_Regression(benchmark::State& state) {
  const SDMCore::SDMModel& model = *SDMCore::sdmModel;
  std::vector<float> feature(kFeature);
  std::mt19937 generator(2);
  for (float& v : feature) v = static_cast<float>(generator() % 256) * 0.00390625f;
  std::vector<float> shape(2 * kPoints, 100.0f);
  for (auto _ : state) {
    for (int start = 0; start < 9; ++start) {
      for (int s = 0; s < kStages; ++s) SDMCore::applyStage(feature.data(), model.stageMaps[s], model.stageBiases[s], shape);
    }
    benchmark::DoNotOptimize(shape.data());
  }
}
BENCHMARK(BM_Regression)->Unit(benchmark::kMillisecond);

// For comparison only, not what the library does: the same products with the
// nine starts batched into one 9-row product per stage (this changes the
// order of the regression and the last bits of its results).
void BM_RegressionBatchedForComparison(benchmark::State& state) {
  const SDMCore::SDMModel& model = *SDMCore::sdmModel;
  std::vector<float> features(9 * kFeature);
  std::mt19937 generator(2);
  for (float& v : features) v = static_cast<float>(generator() % 256) * 0.00390625f;
  std::vector<float> deltas(9 * 2 * kPoints);
  for (auto _ : state) {
    for (int s = 0; s < kStages; ++s) {
      const mp::pca_map& map = model.stageMaps[s];
      cblas_sgemm(CblasRowMajor, CblasNoTrans, CblasNoTrans, 9, 2 * kPoints, kFeature, 1.0f,
                  features.data(), kFeature, map.projection.data(), 2 * kPoints, 0.0f, deltas.data(),
                  2 * kPoints);
    }
    benchmark::DoNotOptimize(deltas.data());
  }
}
BENCHMARK(BM_RegressionBatchedForComparison)->Unit(benchmark::kMillisecond);

// The whole road of align68Points from the library's pieces, each part timed;
// the counters give milliseconds per face and each part's share of the sum.
void BM_Align68PointsBreakdown(benchmark::State& state) {
  Fixture& f = Shared();
  const SDMCore::SDMModel& model = *SDMCore::sdmModel;
  double resize = 0;
  double pyramidTime = 0;
  double descriptors = 0;
  double regression = 0;
  double rest = 0;
  std::vector<float> feature(kFeature);
  std::vector<float> result;
  for (auto _ : state) {
    const auto t0 = Clock::now();
    const Face face = CropFace(f);
    const cv::Mat frame = tavilib::resize_antialias(face.crop, cv::Size(250, 250));
    const auto t1 = Clock::now();
    const Prepared prepared = Prepare(frame, face.faceRect);
    SDMCore::SiftPyramid pyramid = BuildPyramid(prepared.padded);
    const auto t2 = Clock::now();
    uint8_t bytes[128] = {};
    std::vector<std::vector<float>> shapes = prepared.starts;
    double descriptorSeconds = 0;
    double regressionSeconds = 0;
    for (std::vector<float>& shape : shapes) {
      for (float& v : shape) v += static_cast<float>(prepared.pad);
      for (int s = 0; s < kStages; ++s) {
        const auto d0 = Clock::now();
        for (int j = 0; j < kPoints; ++j) {
          float norm = 0;
          pyramid.computeDescriptor(shape[2 * j], shape[2 * j + 1],
                                    static_cast<float>(model.stageLevels[s]), norm, bytes);
          for (int t = 0; t < 128; ++t) feature[j * 128 + t] = bytes[t] * 0.00390625f;
        }
        const auto d1 = Clock::now();
        SDMCore::applyStage(feature.data(), model.stageMaps[s], model.stageBiases[s], shape);
        const auto d2 = Clock::now();
        descriptorSeconds += Seconds(d0, d1);
        regressionSeconds += Seconds(d1, d2);
      }
    }
    const auto t3 = Clock::now();
    result = SDMCore::coordinateMedian(shapes);
    for (float& v : result) v = (v - prepared.pad) / prepared.scale;
    const auto t4 = Clock::now();
    resize += Seconds(t0, t1);
    pyramidTime += Seconds(t1, t2);
    descriptors += descriptorSeconds;
    regression += regressionSeconds;
    rest += Seconds(t2, t3) - descriptorSeconds - regressionSeconds + Seconds(t3, t4);
    benchmark::DoNotOptimize(result.data());
  }
  const double n = static_cast<double>(state.iterations());
  const double total = resize + pyramidTime + descriptors + regression + rest;
  state.counters["resize_ms"] = 1e3 * resize / n;
  state.counters["pyramid_ms"] = 1e3 * pyramidTime / n;
  state.counters["descriptors_ms"] = 1e3 * descriptors / n;
  state.counters["regression_ms"] = 1e3 * regression / n;
  state.counters["resize_share"] = resize / total;
  state.counters["pyramid_share"] = pyramidTime / total;
  state.counters["descriptors_share"] = descriptors / total;
  state.counters["regression_share"] = regression / total;
  state.counters["other_share"] = rest / total;
}
BENCHMARK(BM_Align68PointsBreakdown)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
