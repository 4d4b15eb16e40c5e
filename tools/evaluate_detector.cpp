// Measures a cascade model folder on the held-out validation data:
//
//   build/tools/evaluate_detector --model Tavi/public/ --data ../shared/data/ --min-face 20
//       --curve docs/detector_validation.png
//
// Recall of the faces68 val faces (a detection with an IoU of at least 0.5
// with the face box; other faces in those frames may be unlabelled, so no
// false positives are counted there), false positives per held-out negative
// image and per megapixel, the windows each stage takes in and lets out, NaN
// scores of the scan, and the curve of recall against false positives per
// image over the final scores, drawn as a PNG.
#include <boost/program_options.hpp>

#include <cblas.h>
#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <iostream>
#include <string>
#include <vector>

#include "detector/cascade_loader.h"
#include "command_line.h"
#include "detector_training/cascade_recorder.h"
#include "detector_training/counted_detection.h"
#include "detector_training/face_box.h"
#include "detector_training/parallel_items.h"
#include "detector/scan_settings.h"
#include "detector_training/training_data.h"
#include "nn/net.h"

namespace po = boost::program_options;

namespace {

constexpr float kMatchIoU = 0.5f;
// Below this a detection is not taken to be about the face at all.
constexpr float kMisplacedIoU = 0.1f;

cv::Rect2f boxOf(const tavilib::Detection& detection) {
  return cv::Rect2f(detection.box.left, detection.box.top, detection.box.right - detection.box.left,
                    detection.box.bottom - detection.box.top);
}

// The windows that pass the first `stages` stages, as the next stage gets them.
std::vector<tavilib::Window> windowsAfter(const tavilib::DetectorState& state, size_t stages,
                                          const cv::Mat& image,
                                          const tavilib::CascadeParameter& settings) {
  tavilib::DetectorState before;
  before.stages.assign(state.stages.begin(), state.stages.begin() + stages);
  before.calibration = state.calibration;
  return training::windowsForNextStage(before, image, settings);
}

// What one validation image gave: windows per stage, the scores of the
// detections (of a face image: the best one matching its face, if any), and
// for a face image whether a matching window survived each stage but the
// last.
struct ImageResult {
  training::StageCounts counts;
  std::vector<float> scores;
  std::vector<bool> kept;
  // A detection overlaps the face, but too little to count.
  bool misplaced = false;
};

bool hasMatch(const std::vector<tavilib::Window>& windows, const cv::Rect2f& face) {
  for (const tavilib::Window& window : windows) {
    const cv::Rect2f box(static_cast<float>(window.x), static_cast<float>(window.y),
                         static_cast<float>(window.width), static_cast<float>(window.height));
    if (training::intersectionOverUnion(box, face) >= kMatchIoU) {
      return true;
    }
  }
  return false;
}

void printCounts(const char* what, const training::StageCounts& counts, size_t images) {
  for (size_t s = 0; s < counts.in.size(); ++s) {
    std::printf("  %s, stage %zu: %.1f windows in, %.1f out per image (pass rate %.4f)\n", what, s,
                counts.in[s] / static_cast<double>(images), counts.out[s] / static_cast<double>(images),
                counts.in[s] > 0 ? counts.out[s] / counts.in[s] : 0.0);
  }
}

// Recall against false positives per negative image, one point per final
// score taken as a threshold, on log-scaled false positives.
void drawCurve(const std::vector<float>& faceScores, size_t faces,
               const std::vector<float>& falseScores, size_t negativeImages,
               const std::string& path) {
  std::vector<float> thresholds = faceScores;
  thresholds.insert(thresholds.end(), falseScores.begin(), falseScores.end());
  std::sort(thresholds.begin(), thresholds.end(), std::greater<float>());
  const int width = 640;
  const int height = 480;
  const int margin = 60;
  cv::Mat canvas(height, width, CV_8UC3, cv::Scalar(255, 255, 255));
  const double lowFp = 1e-3;
  const double highFp = 10.0;
  auto toPoint = [&](double fp, double recall) {
    const double x = (std::log10(std::max(fp, lowFp)) - std::log10(lowFp)) /
                     (std::log10(highFp) - std::log10(lowFp));
    return cv::Point(margin + static_cast<int>(x * (width - 2 * margin)),
                     height - margin - static_cast<int>(recall * (height - 2 * margin)));
  };
  cv::rectangle(canvas, toPoint(lowFp, 0.0), toPoint(highFp, 1.0), cv::Scalar(0, 0, 0));
  for (double fp : {1e-3, 1e-2, 1e-1, 1.0, 10.0}) {
    char label[16];
    std::snprintf(label, sizeof label, "%g", fp);
    cv::putText(canvas, label, toPoint(fp, 0.0) + cv::Point(-10, 20), cv::FONT_HERSHEY_SIMPLEX,
                0.45, cv::Scalar(0, 0, 0));
  }
  for (double recall = 0.0; recall <= 1.0001; recall += 0.2) {
    char label[16];
    std::snprintf(label, sizeof label, "%.1f", recall);
    cv::putText(canvas, label, toPoint(lowFp, recall) + cv::Point(-40, 5),
                cv::FONT_HERSHEY_SIMPLEX, 0.45, cv::Scalar(0, 0, 0));
  }
  cv::putText(canvas, "false positives per negative image", cv::Point(margin + 120, height - 15),
              cv::FONT_HERSHEY_SIMPLEX, 0.5, cv::Scalar(0, 0, 0));
  cv::putText(canvas, "recall of faces68 val", cv::Point(margin, margin - 20),
              cv::FONT_HERSHEY_SIMPLEX, 0.5, cv::Scalar(0, 0, 0));
  cv::Point previous;
  bool started = false;
  for (float threshold : thresholds) {
    const double found = static_cast<double>(
        std::count_if(faceScores.begin(), faceScores.end(), [&](float s) { return s >= threshold; }));
    const double wrong = static_cast<double>(std::count_if(
        falseScores.begin(), falseScores.end(), [&](float s) { return s >= threshold; }));
    const cv::Point point = toPoint(wrong / static_cast<double>(negativeImages),
                                    found / static_cast<double>(faces));
    if (started) {
      cv::line(canvas, previous, point, cv::Scalar(200, 60, 0), 2);
    }
    previous = point;
    started = true;
  }
  if (!cv::imwrite(path, canvas)) {
    throw std::runtime_error("cannot write " + path);
  }
}

}  // namespace

int main(int argc, char** argv) {
  std::string model;
  std::string list;
  std::string dataRoot;
  std::string curve;
  int minFace = 20;
  int threads = 2;
  po::options_description described("evaluate_detector: the cascade on the held-out validation");
  described.add_options()("help", "this text")(
      "model", po::value<std::string>(&model)->default_value("Tavi/public/"),
      "the model folder (ending in a separator)")(
      "list", po::value<std::string>(&list)->default_value("cascade.list"), "its list file")(
      "data", po::value<std::string>(&dataRoot)->default_value("../shared/data/"),
      "the data folder (ending in a separator)")(
      "min-face", po::value<int>(&minFace)->default_value(20), "smallest face sought, pixels")(
      "curve", po::value<std::string>(&curve)->default_value(""),
      "write the recall curve to this PNG")(
      "threads", po::value<int>(&threads)->default_value(2), "images measured at once");
  try {
    if (!tools::parseCommandLine(argc, argv, described)) {
      return 0;
    }

    // The nets run one window at a time, where the matrix library's own
    // threads cost more than they give; the workers share out the images.
    openblas_set_num_threads(1);
    const training::DetectorData validation = training::loadValidationData(dataRoot);
    // One copy of the cascade per worker: a net serves one thread at a time.
    std::vector<tavilib::DetectorState> states(static_cast<size_t>(std::max(threads, 1)));
    const tavilib::DetectorParams where(model.c_str(), list.c_str());
    for (tavilib::DetectorState& state : states) {
      if (tavilib::loadCascadeFromFolder(state, where) != tavilib::STATUS_OK) {
        throw std::runtime_error("cannot load the cascade " + model + list);
      }
      state.ready = true;
    }
    const size_t stages = states[0].stages.size();
    const nn::Net<float>& scan = *states[0].stages[0].net;
    std::printf("scan settings: minimum face %d px (more where a base image would exceed the "
                "scan net's %d by %d), scale step %g, window %d, no enlargement\n",
                minFace, scan.declared_input_width(), scan.declared_input_height(),
                static_cast<double>(tavilib::kScaleStep), tavilib::kWindowSize);
    auto settingsFor = [&](const cv::Mat& image) {
      return tavilib::fittingScanSettings(image.cols, image.rows, minFace,
                                          scan.declared_input_width(),
                                          scan.declared_input_height());
    };

    const size_t faces = validation.faces.size();
    const size_t negatives = validation.negatives.size();
    std::vector<ImageResult> results(faces + negatives);
    training::forEachItem(results.size(), states.size(), [&](size_t i, size_t worker) {
      tavilib::DetectorState& state = states[worker];
      ImageResult& result = results[i];
      const cv::Mat& image =
          i < faces ? validation.faces[i].pixels : validation.negatives[i - faces];
      for (const tavilib::Detection& detection :
           training::detectCounting(state, image, settingsFor(image), result.counts)) {
        if (i >= faces) {
          result.scores.push_back(detection.score);
          continue;
        }
        const float overlap = training::intersectionOverUnion(boxOf(detection), validation.faces[i].box);
        if (overlap >= kMatchIoU) {
          result.scores = {std::max(result.scores.empty() ? 0.0f : result.scores[0],
                                    detection.score)};
        }
        result.misplaced = result.misplaced || (overlap > kMisplacedIoU && overlap < kMatchIoU);
      }
      if (i < faces) {
        for (size_t s = 1; s < stages; ++s) {
          result.kept.push_back(
              hasMatch(windowsAfter(state, s, image, settingsFor(image)), validation.faces[i].box));
        }
      }
    });

    training::StageCounts faceCounts;
    training::StageCounts negativeCounts;
    std::vector<float> faceScores;
    std::vector<float> falseScores;
    std::vector<size_t> kept(stages, 0);
    for (size_t i = 0; i < results.size(); ++i) {
      training::StageCounts& counts = i < faces ? faceCounts : negativeCounts;
      counts.in.resize(stages, 0.0);
      counts.out.resize(stages, 0.0);
      for (size_t s = 0; s < stages; ++s) {
        counts.in[s] += results[i].counts.in[s];
        counts.out[s] += results[i].counts.out[s];
      }
      counts.nanScores += results[i].counts.nanScores;
      (i < faces ? faceScores : falseScores)
          .insert((i < faces ? faceScores : falseScores).end(), results[i].scores.begin(),
                  results[i].scores.end());
      for (size_t s = 0; s < results[i].kept.size(); ++s) {
        kept[s] += results[i].kept[s];
      }
    }
    double megapixels = 0.0;
    int largestMinFace = minFace;
    for (const cv::Mat& image : validation.negatives) {
      megapixels += static_cast<double>(image.total()) / 1e6;
      largestMinFace = std::max(
          largestMinFace, tavilib::minimumFaceOf(settingsFor(image), image.cols, image.rows));
    }
    const size_t missed = faces - faceScores.size();
    size_t misplaced = 0;
    for (size_t i = 0; i < faces; ++i) {
      misplaced += results[i].scores.empty() && results[i].misplaced;
    }
    std::printf("faces68 val: %zu faces, %zu found, recall %.4f; of the %zu missed, %zu have a "
                "detection with an IoU between %.1f and %.1f\n",
                faces, faces - missed, static_cast<double>(faces - missed) / static_cast<double>(faces),
                missed, misplaced, static_cast<double>(kMisplacedIoU), static_cast<double>(kMatchIoU));
    std::printf("held-out negatives: %zu images (%.2f megapixels; minimum face up to %d px), %zu "
                "false positives: %.4f per image, %.4f per megapixel\n",
                negatives, megapixels, largestMinFace, falseScores.size(),
                static_cast<double>(falseScores.size()) / static_cast<double>(negatives),
                static_cast<double>(falseScores.size()) / megapixels);
    for (size_t s = 0; s + 1 < stages; ++s) {
      std::printf("  faces with a matching window after stage %zu: %.4f\n", s,
                  static_cast<double>(kept[s]) / static_cast<double>(faces));
    }
    printCounts("face images", faceCounts, faces);
    printCounts("negative images", negativeCounts, negatives);
    std::printf("NaN scan scores: %ld on face images, %ld on negative images\n",
                faceCounts.nanScores, negativeCounts.nanScores);
    if (!curve.empty()) {
      drawCurve(faceScores, faces, falseScores, negatives, curve);
      std::printf("curve written to %s\n", curve.c_str());
    }
  } catch (const po::error& error) {
    std::cerr << "evaluate_detector: " << error.what() << "\n" << described << "\n";
    return 2;
  } catch (const std::exception& error) {
    std::cerr << "evaluate_detector: " << error.what() << "\n";
    return 1;
  }
  return 0;
}
