// Cost of one align68Points call with the shipped model on the bundled photo,
// against the reference road that takes the nine starts one by one, and the
// parts of the call. Run single-threaded:
//
//   OPENBLAS_NUM_THREADS=1 build/benchmarks/alignment_benchmark
//
// BM_AlignTogetherAgainstOneByOne alternates the two roads in one loop and
// reports their times and the ratio; BM_AlignParts times each part of the
// library's road from its pieces.
#include <benchmark/benchmark.h>

#include <chrono>
#include <cstdlib>
#include <vector>

#include <opencv2/core.hpp>
#include <opencv2/imgcodecs.hpp>

#include "alignment/alignment_frame.h"
#include "alignment/sdm_model.h"
#include "alignment/sdm_regression.h"
#include "tavilib.h"

namespace {

using Clock = std::chrono::steady_clock;

double Seconds(Clock::time_point from, Clock::time_point to) {
  return std::chrono::duration<double>(to - from).count();
}

struct Fixture {
  Fixture() {
    if (tavilib::loadSDMModel(TAVI_SOURCE_DIR "/Tavi/public", "landmarks.sdm") != tavilib::STATUS_OK) {
      std::abort();
    }
    photo = cv::imread(TAVI_SOURCE_DIR "/samples/astronaut.png");
    if (photo.empty()) std::abort();
    image = tavilib::Image{photo.cols, photo.rows, 0, photo.data};
  }

  cv::Mat photo;
  tavilib::Image image;
  // The detector's box of the photo's face.
  const tavilib::Rectangle<float> rect{173.0f, 77.0f, 260.0f, 164.0f};
};

Fixture& Shared() {
  static Fixture fixture;
  return fixture;
}

// align68Points with the given regression.
template <typename Regression>
std::vector<float> Align(const Fixture& f, Regression regress) {
  const tavilib::AlignmentFrame frame = tavilib::makeAlignmentFrame(f.photo, f.rect);
  SDMCore::GeneralUnit unit;
  unit.image = frame.grey;
  unit.faceRect = frame.faceRect;
  const SDMCore::SDMModel& model = *SDMCore::sdmModel;
  unit.normalize(model.faceWidth);
  unit.resultShape = regress(model, unit.image, SDMCore::startShapes(model.meanShape, unit.faceRect));
  unit.restoreShapes();
  return tavilib::frameToImage(frame, unit.resultShape);
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

void BM_AlignTogetherAgainstOneByOne(benchmark::State& state) {
  Fixture& f = Shared();
  double together = 0;
  double oneByOne = 0;
  for (auto _ : state) {
    const auto t0 = Clock::now();
    benchmark::DoNotOptimize(Align(f, SDMCore::regressShapes).data());
    const auto t1 = Clock::now();
    benchmark::DoNotOptimize(Align(f, SDMCore::regressShapesOneByOne).data());
    const auto t2 = Clock::now();
    together += Seconds(t0, t1);
    oneByOne += Seconds(t1, t2);
  }
  const double n = static_cast<double>(state.iterations());
  state.counters["together_ms"] = 1e3 * together / n;
  state.counters["one_by_one_ms"] = 1e3 * oneByOne / n;
  state.counters["speedup"] = oneByOne / together;
}
BENCHMARK(BM_AlignTogetherAgainstOneByOne)->Unit(benchmark::kMillisecond);

// The library's road in parts: the working frame (crop, resize, grey), the
// normalisation with the padding and the pyramid, the descriptors of the
// nine starts at every stage, and the stage products; milliseconds per face.
void BM_AlignParts(benchmark::State& state) {
  Fixture& f = Shared();
  const SDMCore::SDMModel& model = *SDMCore::sdmModel;
  const size_t rowLength = model.meanShape.size() / 2 * 128;
  double frameTime = 0;
  double pyramidTime = 0;
  double descriptorTime = 0;
  double productTime = 0;
  for (auto _ : state) {
    const auto t0 = Clock::now();
    const tavilib::AlignmentFrame frame = tavilib::makeAlignmentFrame(f.photo, f.rect);
    const auto t1 = Clock::now();
    SDMCore::GeneralUnit unit;
    unit.image = frame.grey;
    unit.faceRect = frame.faceRect;
    unit.normalize(model.faceWidth);
    std::vector<std::vector<float>> shapes = SDMCore::startShapes(model.meanShape, unit.faceRect);
    SDMCore::FaceFeatures features(unit.image, shapes[0], model.scalesPerOctave,
                                   SDMCore::highestStageLevel(model));
    for (std::vector<float>& shape : shapes) {
      for (float& v : shape) v += static_cast<float>(features.pad());
    }
    const auto t2 = Clock::now();
    std::vector<float> rows(shapes.size() * rowLength);
    for (size_t i = 0; i < model.stageMaps.size(); ++i) {
      const auto d0 = Clock::now();
      for (size_t k = 0; k < shapes.size(); ++k) {
        features.compute(shapes[k], model.stageLevels[i], rows.data() + k * rowLength);
      }
      const auto d1 = Clock::now();
      SDMCore::applyStage(rows.data(), model.stageMaps[i], model.stageBiases[i], shapes.data(),
                          shapes.size());
      const auto d2 = Clock::now();
      descriptorTime += Seconds(d0, d1);
      productTime += Seconds(d1, d2);
    }
    frameTime += Seconds(t0, t1);
    pyramidTime += Seconds(t1, t2);
    benchmark::DoNotOptimize(shapes.data());
  }
  const double n = static_cast<double>(state.iterations());
  state.counters["frame_ms"] = 1e3 * frameTime / n;
  state.counters["pyramid_ms"] = 1e3 * pyramidTime / n;
  state.counters["descriptors_ms"] = 1e3 * descriptorTime / n;
  state.counters["products_ms"] = 1e3 * productTime / n;
}
BENCHMARK(BM_AlignParts)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
