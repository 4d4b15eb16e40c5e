// Trains the 68-point landmark model from the data folder, on boxes from the
// shipped face detector, and writes the model file align68Points reads:
//
//   build/tools/train_landmarks --data ../shared/data/ --cascade Tavi/public/
//       --out Tavi/public/landmarks.sdm --seed 1
//
// Prints the boxes found, the samples, each stage's training error and the
// wall time. The file is written under a temporary name and renamed when
// complete.
#include <boost/program_options.hpp>

#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "alignment/sdm_model.h"
#include "command_line.h"
#include "detector_training/face_box.h"
#include "landmark_training/labelled_images.h"
#include "landmark_training/landmark_sample.h"
#include "landmark_training/sdm_training.h"
#include "landmark_training/training_boxes.h"

namespace po = boost::program_options;

namespace {

double secondsSince(std::chrono::steady_clock::time_point start) {
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

std::vector<int32_t> parseLevels(const std::string& text) {
  std::vector<int32_t> levels;
  std::stringstream stream(text);
  std::string item;
  while (std::getline(stream, item, ',')) {
    levels.push_back(std::stoi(item));
  }
  if (levels.empty()) {
    throw po::error("--levels needs at least one stage");
  }
  return levels;
}

tavilib::Rectangle<float> mirrored(const tavilib::Rectangle<float>& box, int columns) {
  return {static_cast<float>(columns) - box.right, box.top, static_cast<float>(columns) - box.left,
          box.bottom};
}

cv::Rect2f faceBoxOf(const std::vector<float>& points) {
  std::vector<cv::Point2f> corners;
  for (size_t k = 0; k + 1 < points.size(); k += 2) corners.emplace_back(points[k], points[k + 1]);
  return training::faceBoxFromPoints(corners);
}

// A face as one sample sees it.
struct View {
  cv::Mat image;
  std::vector<float> points;
  tavilib::Rectangle<float> box{};
};

}  // namespace

int main(int argc, char** argv) {
  std::string dataRoot;
  std::string cascadeRoot;
  std::string output;
  std::string levels;
  unsigned seed = 1;
  bool withLfw = false;
  double roll = 0.0;
  landmarks::SdmSettings settings;
  po::options_description described("train_landmarks: trains the 68-point landmark model");
  described.add_options()("help", "this text")(
      "data", po::value<std::string>(&dataRoot)->default_value("../shared/data/"),
      "the data folder (ending in a separator)")(
      "cascade", po::value<std::string>(&cascadeRoot)->default_value("Tavi/public/"),
      "the detector's model folder, whose boxes the model learns from")(
      "out", po::value<std::string>(&output)->default_value("Tavi/public/landmarks.sdm"),
      "the model file")(
      "levels", po::value<std::string>(&levels)->default_value("2,2,1,1,0"),
      "pyramid level of each stage, comma-separated")(
      "scales-per-octave", po::value<int32_t>(&settings.scalesPerOctave)->default_value(3), "")(
      "face-width", po::value<int32_t>(&settings.faceWidth)->default_value(100),
      "face box width the face is normalised to")(
      "ridge", po::value<double>(&settings.ridge)->default_value(1e-2), "ridge strength per shape")(
      "roll", po::value<double>(&roll)->default_value(0.0),
      "the samples with moved boxes show the face turned by up to this many degrees")(
      "folds", po::value<int>(&settings.folds)->default_value(5),
      "shapes reach the next stage as a fit without their person's fold moves them")(
      "seed", po::value<unsigned>(&seed)->default_value(1), "random seed")(
      "lfw", po::bool_switch(&withLfw),
      "also learn from lfw68 (machine-made points), without the persons of faces68 val");
  try {
    if (!tools::parseCommandLine(argc, argv, described)) {
      return 0;
    }
    settings.stageLevels = parseLevels(levels);
    if (settings.folds < 1) {
      throw po::error("--folds needs at least one fold");
    }
    const auto start = std::chrono::steady_clock::now();
    landmarks::LabelledImages labelled;
    const std::set<std::string> validationPersons =
        landmarks::personsOf(dataRoot + "faces68/val.csv");
    landmarks::addLabelledImages(dataRoot + "faces68/train.csv", validationPersons, &labelled);
    if (withLfw) {
      landmarks::addLabelledImages(dataRoot + "lfw68/labels.csv", validationPersons, &labelled);
    }
    const std::vector<cv::Mat>& images = labelled.images;
    const std::vector<std::vector<float>>& truths = labelled.truths;
    const std::vector<cv::Rect2f>& faces = labelled.faces;
    const std::vector<tavilib::Rectangle<float>> found =
        landmarks::detectorBoxes(cascadeRoot, images, faces);
    const landmarks::BoxError error = landmarks::measureBoxError(found, faces);
    size_t detected = 0;
    for (const auto& box : found) detected += box.right > box.left;
    std::printf("%zu faces, %zu found by the detector; its boxes against the face box: centre "
                "%+.3f %+.3f (spread %.3f %.3f), log size %+.3f (spread %.3f) (%.0f s)\n",
                faces.size(), detected, static_cast<double>(error.meanShift.x),
                static_cast<double>(error.meanShift.y), static_cast<double>(error.shiftSpread.x),
                static_cast<double>(error.shiftSpread.y), static_cast<double>(error.meanLogScale),
                static_cast<double>(error.logScaleSpread), secondsSince(start));

    // Each face twice, upright and mirrored, each with the detector's box
    // (or the face box moved by the detector's error where it found none)
    // and once more with a box moved by that error, the face turned by up to
    // --roll degrees first.
    std::mt19937 random(seed);
    std::uniform_real_distribution<double> turn(-roll, roll);
    std::vector<landmarks::LandmarkSample> samples;
    size_t skipped = 0;
    for (size_t i = 0; i < images.size(); ++i) {
      View views[4];
      views[0] = {images[i], truths[i]};
      landmarks::mirrorFace(images[i], truths[i], &views[2].image, &views[2].points);
      const bool hasBox = found[i].right > found[i].left;
      views[0].box = hasBox ? found[i] : landmarks::jitteredBox(faces[i], error, random);
      views[2].box = mirrored(views[0].box, images[i].cols);
      for (int v = 1; v < 4; v += 2) {
        const View& upright = views[v - 1];
        if (roll > 0.0) {
          landmarks::rotateFace(upright.image, upright.points, turn(random), &views[v].image,
                                &views[v].points);
        } else {
          views[v].image = upright.image;
          views[v].points = upright.points;
        }
        views[v].box = landmarks::jitteredBox(faceBoxOf(views[v].points), error, random);
      }
      for (const View& view : views) {
        landmarks::LandmarkSample sample;
        sample.person = labelled.persons[i];
        if (landmarks::makeSample(view.image, view.box, view.points, settings.faceWidth, &sample)) {
          samples.push_back(std::move(sample));
        } else {
          ++skipped;
        }
      }
    }
    std::printf("%zu samples, %zu skipped (crop outside the image) (%.0f s)\n", samples.size(),
                skipped, secondsSince(start));
    std::fflush(stdout);

    const SDMCore::SDMModel model =
        landmarks::trainSdm(samples, settings, [&](int stage, double trainingError) {
          std::printf("stage %d: mean training error %.4f (%.0f s)\n", stage + 1, trainingError,
                      secondsSince(start));
          std::fflush(stdout);
        });
    const std::string temporary = output + ".tmp";
    {
      std::ofstream file(temporary, std::ios::binary);
      if (!SDMCore::writeSDMModel(file, model) || !file.flush()) {
        throw std::runtime_error("cannot write " + temporary);
      }
    }
    std::filesystem::rename(temporary, output);
    std::printf("model written to %s; wall time %.0f s\n", output.c_str(), secondsSince(start));
  } catch (const po::error& problem) {
    std::cerr << "train_landmarks: " << problem.what() << "\n" << described << "\n";
    return 2;
  } catch (const std::exception& problem) {
    std::cerr << "train_landmarks: " << problem.what() << "\n";
    return 1;
  }
  return 0;
}
