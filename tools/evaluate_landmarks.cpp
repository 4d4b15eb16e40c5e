// Measures a landmark model on the held-out faces68 val persons:
//
//   build/tools/evaluate_landmarks --model Tavi/public/landmarks.sdm --cascade Tavi/public/
//       --data ../shared/data/ --curve docs/landmark_validation.png
//
// Errors are point-to-point distances over the distance between the outer
// eye corners (points 36 and 45), averaged over the points of a face. Faces
// are aligned from the boxes of our own detector (faces it misses are
// counted apart) and from the face box convention. Reports mean, median,
// failures (error above 0.1), each region, the five points of align5Points,
// the error after each stage, and draws the cumulative error curves.
#include <boost/program_options.hpp>

#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <string>
#include <vector>

#include "alignment/sdm_model.h"
#include "command_line.h"
#include "landmark_training/labelled_images.h"
#include "landmark_training/sdm_training.h"
#include "landmark_training/training_boxes.h"
#include "tavilib.h"

namespace po = boost::program_options;

namespace {

constexpr double kFailure = 0.1;

struct Region {
  const char* name;
  int first;
  int last;
};
const Region kRegions[] = {
    {"jaw", 0, 16}, {"brows", 17, 26}, {"nose", 27, 35}, {"eyes", 36, 47}, {"mouth", 48, 67}};
const std::vector<std::vector<int>> kFivePointGroups = {
    {36, 37, 38, 39, 40, 41}, {42, 43, 44, 45, 46, 47}, {30}, {48}, {54}};

double eyeDistance(const std::vector<float>& truth) {
  return std::hypot(truth[2 * 36] - truth[2 * 45], truth[2 * 36 + 1] - truth[2 * 45 + 1]);
}

double pointsError(const std::vector<float>& shape, const std::vector<float>& truth, int first,
                   int last) {
  double sum = 0.0;
  for (int k = first; k <= last; ++k) {
    sum += std::hypot(shape[2 * k] - truth[2 * k], shape[2 * k + 1] - truth[2 * k + 1]);
  }
  return sum / (last - first + 1) / eyeDistance(truth);
}

std::vector<float> fivePoints(const std::vector<float>& shape) {
  std::vector<float> five;
  for (const std::vector<int>& group : kFivePointGroups) {
    float x = 0.0f;
    float y = 0.0f;
    for (int index : group) {
      x += shape[2 * index];
      y += shape[2 * index + 1];
    }
    five.push_back(x / static_cast<float>(group.size()));
    five.push_back(y / static_cast<float>(group.size()));
  }
  return five;
}

struct Summary {
  std::vector<double> errors;
  std::vector<double> regions[5];
  std::vector<double> five;
};

void printSummary(const char* what, Summary summary) {
  std::vector<double>& errors = summary.errors;
  if (errors.empty()) {
    return;
  }
  std::sort(errors.begin(), errors.end());
  double mean = 0.0;
  size_t failures = 0;
  for (double error : errors) {
    mean += error / static_cast<double>(errors.size());
    failures += error > kFailure;
  }
  std::printf("%s: %zu faces, mean %.4f, median %.4f, failures %.4f\n", what, errors.size(), mean,
              errors[errors.size() / 2], static_cast<double>(failures) / errors.size());
  std::printf("  regions:");
  for (int r = 0; r < 5; ++r) {
    double sum = 0.0;
    for (double e : summary.regions[r]) sum += e;
    std::printf(" %s %.4f", kRegions[r].name, sum / summary.regions[r].size());
  }
  double five = 0.0;
  for (double e : summary.five) five += e;
  std::printf("; five points %.4f\n", five / summary.five.size());
}

void drawCurves(const std::vector<std::pair<std::string, std::vector<double>>>& curves,
                const std::string& path) {
  const int width = 640;
  const int height = 480;
  const int margin = 60;
  const double largest = 0.15;
  cv::Mat canvas(height, width, CV_8UC3, cv::Scalar(255, 255, 255));
  auto toPoint = [&](double error, double share) {
    return cv::Point(margin + static_cast<int>(error / largest * (width - 2 * margin)),
                     height - margin - static_cast<int>(share * (height - 2 * margin)));
  };
  cv::rectangle(canvas, toPoint(0, 0), toPoint(largest, 1), cv::Scalar(0, 0, 0));
  for (double error = 0.0; error <= largest + 1e-9; error += 0.05) {
    char label[16];
    std::snprintf(label, sizeof label, "%.2f", error);
    cv::putText(canvas, label, toPoint(error, 0) + cv::Point(-15, 20), cv::FONT_HERSHEY_SIMPLEX,
                0.45, cv::Scalar(0, 0, 0));
  }
  for (double share = 0.0; share <= 1.0001; share += 0.2) {
    char label[16];
    std::snprintf(label, sizeof label, "%.1f", share);
    cv::putText(canvas, label, toPoint(0, share) + cv::Point(-40, 5), cv::FONT_HERSHEY_SIMPLEX,
                0.45, cv::Scalar(0, 0, 0));
  }
  cv::putText(canvas, "error / outer eye corner distance", cv::Point(margin + 140, height - 15),
              cv::FONT_HERSHEY_SIMPLEX, 0.5, cv::Scalar(0, 0, 0));
  const cv::Scalar colours[] = {cv::Scalar(200, 60, 0), cv::Scalar(0, 140, 0)};
  for (size_t c = 0; c < curves.size(); ++c) {
    std::vector<double> errors = curves[c].second;
    std::sort(errors.begin(), errors.end());
    cv::Point previous = toPoint(0, 0);
    for (size_t i = 0; i < errors.size(); ++i) {
      const cv::Point point =
          toPoint(std::min(errors[i], largest), static_cast<double>(i + 1) / errors.size());
      cv::line(canvas, previous, point, colours[c % 2], 2);
      previous = point;
    }
    cv::putText(canvas, curves[c].first, toPoint(0.09, 0.3 - 0.07 * static_cast<double>(c)),
                cv::FONT_HERSHEY_SIMPLEX, 0.5, colours[c % 2]);
  }
  cv::putText(canvas, "share of faces68 val faces", cv::Point(margin, margin - 20),
              cv::FONT_HERSHEY_SIMPLEX, 0.5, cv::Scalar(0, 0, 0));
  if (!cv::imwrite(path, canvas)) {
    throw std::runtime_error("cannot write " + path);
  }
}

// Aligns every face from its box and sums up the errors.
Summary measure(const std::vector<cv::Mat>& images, const std::vector<std::vector<float>>& truths,
                const std::vector<tavilib::Rectangle<float>>& boxes) {
  Summary summary;
  for (size_t i = 0; i < images.size(); ++i) {
    if (boxes[i].right <= boxes[i].left) {
      continue;
    }
    tavilib::Image image{images[i].cols, images[i].rows, static_cast<int32_t>(images[i].step),
                         images[i].data};
    std::vector<float> shape;
    if (tavilib::align68Points(image, boxes[i], shape) != tavilib::STATUS_OK) {
      throw std::runtime_error("align68Points refused the model");
    }
    summary.errors.push_back(landmarks::normalisedError(shape, truths[i]));
    for (int r = 0; r < 5; ++r) {
      summary.regions[r].push_back(pointsError(shape, truths[i], kRegions[r].first, kRegions[r].last));
    }
    const std::vector<float> five = fivePoints(shape);
    const std::vector<float> trueFive = fivePoints(truths[i]);
    double fiveSum = 0.0;
    for (size_t k = 0; k < 5; ++k) {
      fiveSum += std::hypot(five[2 * k] - trueFive[2 * k], five[2 * k + 1] - trueFive[2 * k + 1]);
    }
    summary.five.push_back(fiveSum / 5.0 / eyeDistance(truths[i]));
  }
  return summary;
}

void loadModel(const std::string& path) {
  const std::filesystem::path file(path);
  if (tavilib::loadSDMModel(file.parent_path().empty() ? "." : file.parent_path().string(),
                            file.filename().string()) != tavilib::STATUS_OK) {
    throw std::runtime_error("cannot read the model " + path);
  }
}

}  // namespace

int main(int argc, char** argv) {
  std::string modelPath;
  std::string cascadeRoot;
  std::string dataRoot;
  std::string curve;
  po::options_description described("evaluate_landmarks: the landmark model on faces68 val");
  described.add_options()("help", "this text")(
      "model", po::value<std::string>(&modelPath)->default_value("Tavi/public/landmarks.sdm"),
      "the model file")(
      "cascade", po::value<std::string>(&cascadeRoot)->default_value("Tavi/public/"),
      "the detector's model folder")(
      "data", po::value<std::string>(&dataRoot)->default_value("../shared/data/"),
      "the data folder (ending in a separator)")(
      "curve", po::value<std::string>(&curve)->default_value(""),
      "write the cumulative error curves to this PNG");
  try {
    if (!tools::parseCommandLine(argc, argv, described)) {
      return 0;
    }
    landmarks::LabelledImages labelled;
    landmarks::addLabelledImages(dataRoot + "faces68/val.csv", {}, &labelled);
    const std::vector<cv::Mat>& images = labelled.images;
    const std::vector<std::vector<float>>& truths = labelled.truths;
    const std::vector<cv::Rect2f>& faces = labelled.faces;
    const std::vector<tavilib::Rectangle<float>> detected =
        landmarks::detectorBoxes(cascadeRoot, images, faces);
    std::vector<tavilib::Rectangle<float>> convention;
    size_t missed = 0;
    for (size_t i = 0; i < faces.size(); ++i) {
      convention.push_back({faces[i].x, faces[i].y, faces[i].br().x, faces[i].br().y});
      missed += detected[i].right <= detected[i].left;
    }
    std::printf("faces68 val: %zu faces, %zu missed by the detector (left out of its figures)\n",
                faces.size(), missed);

    SDMCore::SDMModel model;
    if (!SDMCore::readSDMModel(modelPath, model) || model.stageMaps.empty()) {
      throw std::runtime_error("cannot read the model " + modelPath);
    }
    // The error after each stage: the model cut after it, through the
    // public alignment.
    const std::string partial = modelPath + ".stages.tmp";
    for (size_t stages = 1; stages < model.stageMaps.size(); ++stages) {
      SDMCore::SDMModel cut = model;
      cut.stageMaps.resize(stages);
      cut.stageBiases.resize(stages);
      cut.stageMatrices.resize(stages);
      {
        std::ofstream file(partial, std::ios::binary);
        SDMCore::writeSDMModel(file, cut);
      }
      loadModel(partial);
      char label[64];
      std::snprintf(label, sizeof label, "detector boxes, after stage %zu", stages);
      printSummary(label, measure(images, truths, detected));
    }
    std::filesystem::remove(partial);
    loadModel(modelPath);
    const Summary fromDetector = measure(images, truths, detected);
    const Summary fromConvention = measure(images, truths, convention);
    printSummary("detector boxes, all stages", fromDetector);
    printSummary("face-box convention, all stages", fromConvention);
    if (!curve.empty()) {
      drawCurves({{"detector boxes", fromDetector.errors},
                  {"face-box convention", fromConvention.errors}},
                 curve);
      std::printf("curves written to %s\n", curve.c_str());
    }
  } catch (const po::error& problem) {
    std::cerr << "evaluate_landmarks: " << problem.what() << "\n" << described << "\n";
    return 2;
  } catch (const std::exception& problem) {
    std::cerr << "evaluate_landmarks: " << problem.what() << "\n";
    return 1;
  }
  return 0;
}
