// detect on a 640x480 image with the built-in cascade at its declared sizes,
// weights from the fillers, split into the pyramid scan, the grading by the
// window nets and the calibration.
//
//   OPENBLAS_NUM_THREADS=1 build/benchmarks/detect_benchmark
//
// The counters give how many windows each part handles. With filled weights
// every scan window scores near 0.5: all pass the first threshold, none the
// second, so grading and calibration see the scan's full list.
#include <benchmark/benchmark.h>

#include <opencv2/core.hpp>

#include <random>
#include <vector>

#include "detector/cascade_driver.h"
#include "detector/default_cascade_tables.h"
#include "detector/pyramid_scan.h"
#include "detector/window_filter.h"
#include "detector/window_grading.h"
#include "nn/net.h"

namespace {

using tavilib::CascadeParameter;
using tavilib::CascadeStage;
using tavilib::DetectorState;
using tavilib::Window;

const CascadeParameter kParams{1.0f, 640, 0.05f, 6, 1.3f, 12};

CascadeStage StageFrom(const std::string& text, const std::vector<double>& mean) {
  CascadeStage stage;
  stage.net.reset(new nn::Net<float>(text, nn::NetDescription::kText));
  stage.mean.assign(mean.begin(), mean.end());
  return stage;
}

// The built-in cascade with the weights its fillers give.
DetectorState& BuiltInState() {
  static DetectorState* state = [] {
    const tavilib::DefaultCascadeTables tables;
    auto* built = new DetectorState();
    built->stages.push_back(StageFrom(tables.stage0NetText, {}));
    built->stages[0].net->FirstRun();
    built->stages.push_back(StageFrom(tables.stage1NetText, tables.stage1Mean));
    built->stages.push_back(StageFrom(tables.stage2NetText, tables.stage2Mean));
    for (int i = 0; i < 3; ++i) {
      built->stages[i].threshold = static_cast<float>(tables.thresholds[i]);
    }
    built->calibration = StageFrom(tables.calibrationNetText, tables.calibrationMean);
    for (size_t i = 0; i < tables.offsetsX.size(); ++i) {
      built->calibration.offsetsScales.push_back(
          {tables.offsetsX[i], tables.offsetsY[i], static_cast<float>(tables.scales[i])});
    }
    built->ready = true;
    return built;
  }();
  return *state;
}

cv::Mat& TestImage() {
  static cv::Mat image = [] {
    cv::Mat pixels(480, 640, CV_8UC3);
    std::mt19937 generator(1);
    for (auto it = pixels.begin<cv::Vec3b>(); it != pixels.end<cv::Vec3b>(); ++it) {
      *it = cv::Vec3b(generator() % 256, generator() % 256, generator() % 256);
    }
    return pixels;
  }();
  return image;
}

// The scan's windows in the input frame, above the first threshold.
std::vector<Window> FirstStageWindows() {
  const tavilib::PyramidScan scan =
      tavilib::scanPyramid(TestImage(), kParams, BuiltInState().stages[0]);
  std::vector<Window> windows = scan.windows;
  const float factor = 1.0f / scan.baseScale;
  for (Window& w : windows) {
    w.x = static_cast<int32_t>(w.x * factor);
    w.y = static_cast<int32_t>(w.y * factor);
    w.width = static_cast<int32_t>(w.width * factor);
    w.height = static_cast<int32_t>(w.height * factor);
  }
  return tavilib::keepAboveThreshold(windows, BuiltInState().stages[0].threshold);
}

void BM_Detect(benchmark::State& state) {
  cv::Mat& image = TestImage();
  const tavilib::Image input{image.cols, image.rows, 0, image.data};
  const tavilib::CascadeSteps steps{tavilib::scanPyramid, tavilib::gradeWindows,
                                    tavilib::calibrateWindows};
  std::vector<tavilib::Detection> detections;
  for (auto _ : state) {
    detections.clear();
    tavilib::runCascade(input, BuiltInState(), detections, kParams, steps);
  }
  state.counters["detections"] = static_cast<double>(detections.size());
}

void BM_Scan(benchmark::State& state) {
  size_t windows = 0;
  for (auto _ : state) {
    windows = tavilib::scanPyramid(TestImage(), kParams, BuiltInState().stages[0]).windows.size();
  }
  state.counters["windows"] = static_cast<double>(windows);
}

void BM_Grade(benchmark::State& state) {
  const std::vector<Window> windows = FirstStageWindows();
  CascadeStage& stage = BuiltInState().stages[state.range(0)];
  for (auto _ : state) {
    benchmark::DoNotOptimize(tavilib::gradeWindows(windows, stage, TestImage()));
  }
  state.counters["windows"] = static_cast<double>(windows.size());
  state.counters["per_window_us"] = benchmark::Counter(
      static_cast<double>(windows.size()), benchmark::Counter::kIsIterationInvariantRate |
                                               benchmark::Counter::kInvert);
}

void BM_Calibrate(benchmark::State& state) {
  const std::vector<Window> windows = FirstStageWindows();
  for (auto _ : state) {
    benchmark::DoNotOptimize(
        tavilib::calibrateWindows(windows, BuiltInState().calibration, TestImage()));
  }
  state.counters["windows"] = static_cast<double>(windows.size());
}

BENCHMARK(BM_Detect)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Scan)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Grade)->Arg(1)->Arg(2)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Calibrate)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
