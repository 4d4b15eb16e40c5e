#include <gtest/gtest.h>

#include <opencv2/imgcodecs.hpp>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "tavilib.h"
#include "temp_dir.h"

namespace tavilib {
namespace {

namespace fs = std::filesystem;

const char kModelRoot[] = TAVI_SOURCE_DIR "/Tavi/public/";
const char kValidationCsv[] = TAVI_SOURCE_DIR "/../shared/data/faces68/val.csv";

// The first few held-out frames with their 68 points.
struct Frame {
  cv::Mat pixels;
  std::vector<float> points;
};

std::vector<Frame> ValidationFrames(int count) {
  std::vector<Frame> frames;
  std::ifstream csv(kValidationCsv);
  std::string line;
  std::getline(csv, line);
  while (static_cast<int>(frames.size()) < count && std::getline(csv, line)) {
    std::stringstream fields(line);
    std::string file;
    std::string person;
    std::getline(fields, file, ',');
    std::getline(fields, person, ',');
    Frame frame{cv::imread(fs::path(kValidationCsv).parent_path() / file), {}};
    for (std::string value; std::getline(fields, value, ',');) {
      frame.points.push_back(std::stof(value));
    }
    frames.push_back(std::move(frame));
  }
  return frames;
}

std::vector<Detection> Detect(Detector& detector, const cv::Mat& image) {
  // A minimum face of 30 pixels keeps the base image within the built-in scan
  // net's 384 pixels.
  const int longEdge = std::max(image.cols, image.rows);
  const CascadeParameter scan{1.0f, longEdge, 30.5f / static_cast<float>(longEdge), 30, 1.2f, 12};
  std::vector<Detection> detections;
  Image wrapped{image.cols, image.rows, static_cast<int32_t>(image.step), image.data};
  EXPECT_EQ(detect(wrapped, detector, detections, scan), STATUS_OK);
  return detections;
}

// The built-in load finds its weights at "../../../Tavi/public/cascades/...":
// run it from three folders below a folder that links to the project's.
Status LoadBuiltIn(Detector& detector) {
  TempDir dir;
  fs::create_directory_symlink(TAVI_SOURCE_DIR "/Tavi", dir.path() + "/Tavi");
  fs::create_directories(dir.path() + "/a/b/c");
  const fs::path before = fs::current_path();
  fs::current_path(dir.path() + "/a/b/c");
  const Status status = detector.load();
  fs::current_path(before);
  return status;
}

TEST(ShippedCascadeTest, FolderAndBuiltInLoadsFindTheSameFaces) {
  const std::vector<Frame> frames = ValidationFrames(4);
  if (frames.empty()) {
    GTEST_SKIP() << "no validation data at " << kValidationCsv;
  }
  Detector fromFolder;
  ASSERT_EQ(fromFolder.load(DetectorParams(kModelRoot, "cascade.list")), STATUS_OK);
  Detector builtIn;
  ASSERT_EQ(LoadBuiltIn(builtIn), STATUS_OK);
  for (const Frame& frame : frames) {
    ASSERT_FALSE(frame.pixels.empty());
    const std::vector<Detection> folderFaces = Detect(fromFolder, frame.pixels);
    const std::vector<Detection> builtInFaces = Detect(builtIn, frame.pixels);
    ASSERT_EQ(folderFaces.size(), builtInFaces.size());
    for (size_t i = 0; i < folderFaces.size(); ++i) {
      EXPECT_EQ(folderFaces[i].box.left, builtInFaces[i].box.left);
      EXPECT_EQ(folderFaces[i].box.top, builtInFaces[i].box.top);
      EXPECT_EQ(folderFaces[i].box.right, builtInFaces[i].box.right);
      EXPECT_EQ(folderFaces[i].box.bottom, builtInFaces[i].box.bottom);
      EXPECT_EQ(folderFaces[i].score, builtInFaces[i].score);
    }
    // One of the faces covers the middle of the face: the inner eye corners,
    // the nose tip and the lower lip (placement is measured by
    // evaluate_detector).
    const auto holdsTheFace = [&frame](const Detection& face) {
      const Rectangle<float>& box = face.box;
      for (int point : {39, 42, 30, 57}) {
        const float x = frame.points[2 * point];
        const float y = frame.points[2 * point + 1];
        if (!(x > box.left && x < box.right && y > box.top &&
              y < box.bottom)) {
          return false;
        }
      }
      return true;
    };
    EXPECT_TRUE(std::any_of(folderFaces.begin(), folderFaces.end(), holdsTheFace));
  }
}

TEST(ScanSettingsForTest, FitTheLoadedScanNetAndRefuseWhatCannotBeScanned) {
  Detector none;
  ScanSettings settings{};
  EXPECT_EQ(scanSettingsFor(none, 640, 480, 40, settings), STATUS_DETECTOR_NOT_READY);
  Detector fromFolder;
  ASSERT_EQ(fromFolder.load(DetectorParams(kModelRoot, "cascade.list")), STATUS_OK);
  EXPECT_THROW(scanSettingsFor(fromFolder, 0, 480, 40, settings), std::invalid_argument);
  EXPECT_THROW(scanSettingsFor(fromFolder, 640, 480, 0, settings), std::invalid_argument);
  // A full-HD photo searched for faces of 40 pixels has a base image of 576
  // pixels: inside the shipped 640, beyond the built-in 384, where the
  // smallest face that fits is 1920 * 12 / 384 = 60.
  ASSERT_EQ(scanSettingsFor(fromFolder, 1920, 1080, 40, settings), STATUS_OK);
  EXPECT_EQ(settings.minFace, 40);
  Detector builtIn;
  ASSERT_EQ(LoadBuiltIn(builtIn), STATUS_OK);
  ASSERT_EQ(scanSettingsFor(builtIn, 1920, 1080, 40, settings), STATUS_OK);
  EXPECT_EQ(settings.minFace, 60);
  // The settings scan a large image with either cascade.
  const cv::Mat large(1080, 1920, CV_8UC3, cv::Scalar(90, 120, 150));
  std::vector<Detection> detections;
  const Image wrapped{large.cols, large.rows, 0, large.data};
  EXPECT_EQ(detect(wrapped, builtIn, detections, settings.params), STATUS_OK);
}

TEST(ShippedLandmarksTest, PlaceTheHeldOutPointsFromTheDetectorsBoxes) {
  const std::vector<Frame> frames = ValidationFrames(4);
  if (frames.empty()) {
    GTEST_SKIP() << "no validation data at " << kValidationCsv;
  }
  Detector detector;
  ASSERT_EQ(detector.load(DetectorParams(kModelRoot, "cascade.list")), STATUS_OK);
  ASSERT_EQ(loadSDMModel(kModelRoot, "landmarks.sdm"), STATUS_OK);
  for (const Frame& frame : frames) {
    const std::vector<Detection> faces = Detect(detector, frame.pixels);
    ASSERT_FALSE(faces.empty());
    Image wrapped{frame.pixels.cols, frame.pixels.rows, 0, frame.pixels.data};
    std::vector<float> points;
    ASSERT_EQ(align68Points(wrapped, faces[0].box, points), STATUS_OK);
    ASSERT_EQ(points.size(), 136u);
    const float eyes = std::hypot(frame.points[72] - frame.points[90], frame.points[73] - frame.points[91]);
    float error = 0.0f;
    for (int k = 0; k < 68; ++k) {
      error += std::hypot(points[2 * k] - frame.points[2 * k], points[2 * k + 1] - frame.points[2 * k + 1]);
    }
    EXPECT_LT(error / 68.0f / eyes, 0.12f);
  }
  unloadSDMModel();
}

}  // namespace
}  // namespace tavilib
