// detect with the shipped cascade (Tavi/public/cascade.list) on a 640 by 480
// photo, split into the pyramid scan, the grading by each window net and
// the calibration:
//
//   OPENBLAS_NUM_THREADS=1 build/benchmarks/detect_benchmark
//
// The photo is TAVI_BENCHMARK_PHOTO when that names an image (scaled to
// 640 by 480), else one made from the data folder: a negatives/ scene with
// three faces68 val frames of different sizes set into it. The counters give
// the windows each stage takes in per call.
#include <benchmark/benchmark.h>

#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include <chrono>
#include <cmath>
#include <cstdlib>
#include <fstream>
#include <iostream>
#include <string>
#include <vector>

#include "detector/cascade_driver.h"
#include "detector/cascade_loader.h"
#include "detector/pyramid_scan.h"
#include "detector/window_grading.h"
#include "detector_training/cascade_recorder.h"
#include "detector_training/counted_detection.h"
#include "detector_training/training_data.h"

namespace {

using tavilib::CascadeParameter;
using tavilib::DetectorState;
using tavilib::Window;

const char kDataRoot[] = TAVI_SOURCE_DIR "/../shared/data/";

// Faces of minFace pixels and up in a 640 by 480 photo.
CascadeParameter ScanFor(int minFace) {
  return CascadeParameter{1.0f, 640, (static_cast<float>(minFace) + 0.5f) / 640.0f, 30, 1.2f, 12};
}

DetectorState& Shipped() {
  static DetectorState* state = [] {
    auto* loaded = new DetectorState();
    const tavilib::DetectorParams where(TAVI_SOURCE_DIR "/Tavi/public/", "cascade.list");
    if (tavilib::loadCascadeFromFolder(*loaded, where) != tavilib::STATUS_OK) {
      std::cerr << "no cascade at " << where.cascadeRoot << where.cascadeList << "\n";
      std::exit(1);
    }
    loaded->ready = true;
    return loaded;
  }();
  return *state;
}

cv::Mat MadePhoto() {
  const std::vector<training::LabelledFace> faces =
      training::readLabelledFaces(std::string(kDataRoot) + "faces68/val.csv");
  std::vector<cv::String> scenes;
  cv::glob(std::string(kDataRoot) + "negatives/images/*.jpg", scenes, false);
  cv::Mat photo;
  cv::resize(training::readImage(scenes.at(0)), photo, cv::Size(640, 480), 0, 0, cv::INTER_AREA);
  const int heights[] = {220, 150, 100};
  const cv::Point places[] = {{30, 200}, {300, 60}, {500, 330}};
  for (int i = 0; i < 3; ++i) {
    const cv::Mat frame =
        training::readImage(std::string(kDataRoot) + "faces68/" + faces.at(10 * i).file);
    cv::Mat sized;
    cv::resize(frame, sized, cv::Size(frame.cols * heights[i] / frame.rows, heights[i]), 0, 0,
               cv::INTER_AREA);
    const cv::Rect place = cv::Rect(places[i], sized.size()) & cv::Rect(0, 0, 640, 480);
    sized(cv::Rect(0, 0, place.width, place.height)).copyTo(photo(place));
  }
  return photo;
}

cv::Mat& Photo() {
  static cv::Mat photo = [] {
    const char* path = std::getenv("TAVI_BENCHMARK_PHOTO");
    if (path == nullptr) {
      return MadePhoto();
    }
    cv::Mat sized;
    cv::resize(training::readImage(path), sized, cv::Size(640, 480), 0, 0, cv::INTER_AREA);
    return sized;
  }();
  return photo;
}

void BM_Detect(benchmark::State& state) {
  const CascadeParameter scan = ScanFor(static_cast<int>(state.range(0)));
  std::vector<tavilib::Detection> detections;
  for (auto _ : state) {
    detections.clear();
    tavilib::runCascade({Photo().cols, Photo().rows, 0, Photo().data}, Shipped(), detections, scan,
                        {tavilib::scanPyramid, tavilib::gradeWindows, tavilib::calibrateWindows});
  }
  training::StageCounts counts;
  training::detectCounting(Shipped(), Photo(), scan, counts);
  for (size_t s = 0; s < counts.in.size(); ++s) {
    state.counters["stage" + std::to_string(s) + "_in"] = counts.in[s];
  }
  state.counters["faces"] = static_cast<double>(detections.size());
}

// The reference road: every window through the stage's net alone.
std::vector<Window> GradeAlone(std::vector<Window> windows, tavilib::CascadeStage& stage,
                               const cv::Mat& image) {
  for (Window& window : windows) window = tavilib::gradeWindows({window}, stage, image)[0];
  return windows;
}

std::vector<Window> CalibrateAlone(std::vector<Window> windows, tavilib::CascadeStage& stage,
                                   const cv::Mat& image) {
  for (Window& window : windows) window = tavilib::calibrateWindows({window}, stage, image)[0];
  return windows;
}

// detect as the library runs it against the reference road, alternating in
// one loop: their times, the ratio, and whether the faces are the same.
void BM_DetectTogetherAgainstAlone(benchmark::State& state) {
  const CascadeParameter scan = ScanFor(static_cast<int>(state.range(0)));
  const tavilib::Image image{Photo().cols, Photo().rows, 0, Photo().data};
  double together = 0;
  double alone = 0;
  bool same = true;
  for (auto _ : state) {
    std::vector<tavilib::Detection> library;
    std::vector<tavilib::Detection> reference;
    const auto t0 = std::chrono::steady_clock::now();
    tavilib::runCascade(image, Shipped(), library, scan,
                        {tavilib::scanPyramid, tavilib::gradeWindows, tavilib::calibrateWindows});
    const auto t1 = std::chrono::steady_clock::now();
    tavilib::runCascade(image, Shipped(), reference, scan,
                        {tavilib::scanPyramid, GradeAlone, CalibrateAlone});
    const auto t2 = std::chrono::steady_clock::now();
    together += std::chrono::duration<double>(t1 - t0).count();
    alone += std::chrono::duration<double>(t2 - t1).count();
    same = same && library.size() == reference.size();
    for (size_t i = 0; same && i < library.size(); ++i) {
      same = library[i].box.left == reference[i].box.left && library[i].box.top == reference[i].box.top &&
             library[i].box.right == reference[i].box.right &&
             library[i].box.bottom == reference[i].box.bottom &&
             std::abs(library[i].score - reference[i].score) <= 1e-6f;
    }
  }
  const double n = static_cast<double>(state.iterations());
  state.counters["together_ms"] = 1e3 * together / n;
  state.counters["alone_ms"] = 1e3 * alone / n;
  state.counters["speedup"] = alone / together;
  state.counters["same_faces"] = same ? 1 : 0;
}

void BM_Scan(benchmark::State& state) {
  const CascadeParameter scan = ScanFor(static_cast<int>(state.range(0)));
  size_t windows = 0;
  for (auto _ : state) {
    windows = tavilib::scanPyramid(Photo(), scan, Shipped().stages[0]).windows.size();
  }
  state.counters["windows"] = static_cast<double>(windows);
}

// The windows that stage `stage` grades in a detection of faces of 40 and up.
std::vector<Window> WindowsOfStage(size_t stage) {
  DetectorState before;
  before.stages.assign(Shipped().stages.begin(), Shipped().stages.begin() + stage);
  before.calibration = Shipped().calibration;
  return training::windowsForNextStage(before, Photo(), ScanFor(40));
}

void BM_Grade(benchmark::State& state) {
  const size_t stage = static_cast<size_t>(state.range(0));
  const std::vector<Window> windows = WindowsOfStage(stage);
  for (auto _ : state) {
    benchmark::DoNotOptimize(tavilib::gradeWindows(windows, Shipped().stages[stage], Photo()));
  }
  state.counters["windows"] = static_cast<double>(windows.size());
  state.counters["per_window_us"] = benchmark::Counter(
      static_cast<double>(windows.size()), benchmark::Counter::kIsIterationInvariantRate |
                                               benchmark::Counter::kInvert);
}

void BM_Calibrate(benchmark::State& state) {
  const std::vector<Window> windows = WindowsOfStage(1);
  for (auto _ : state) {
    benchmark::DoNotOptimize(
        tavilib::calibrateWindows(windows, Shipped().calibration, Photo()));
  }
  state.counters["windows"] = static_cast<double>(windows.size());
}

long ResidentKiB() {
  std::ifstream status("/proc/self/status");
  std::string key;
  long value = 0;
  while (status >> key) {
    if (key == "VmRSS:") {
      status >> value;
      break;
    }
  }
  return value;
}

// What a loaded Detector holds once it has scanned a 1920 by 1080 photo for
// faces of 40 pixels and up (a base image of 576 by 324): the nets, their
// blobs and the scan net's stored response.
void BM_LoadedDetectorMemory(benchmark::State& state) {
  cv::Mat large;
  cv::resize(Photo(), large, cv::Size(1920, 1080));
  for (auto _ : state) {
    const long before = ResidentKiB();
    tavilib::Detector detector;
    detector.load(tavilib::DetectorParams(TAVI_SOURCE_DIR "/Tavi/public/", "cascade.list"));
    std::vector<tavilib::Detection> faces;
    tavilib::detect({large.cols, large.rows, 0, large.data}, detector, faces,
                    CascadeParameter{1.0f, 1920, 40.5f / 1920.0f, 30, 1.2f, 12});
    state.counters["resident_MB"] = static_cast<double>(ResidentKiB() - before) / 1024.0;
  }
}

BENCHMARK(BM_LoadedDetectorMemory)->Iterations(1)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Detect)->Arg(40)->Arg(20)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_DetectTogetherAgainstAlone)->Arg(40)->Arg(20)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Scan)->Arg(40)->Arg(20)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Grade)->Arg(1)->Arg(2)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Calibrate)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
