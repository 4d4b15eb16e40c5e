#include <gtest/gtest.h>

#include <opencv2/imgcodecs.hpp>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
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
  csv.ignore(1 << 20, '\n');
  for (std::string line; static_cast<int>(frames.size()) < count && std::getline(csv, line);) {
    std::stringstream fields(line);
    std::string file, value;
    std::getline(fields, file, ',');
    std::getline(fields, value, ',');  // the person
    frames.push_back({cv::imread(fs::path(kValidationCsv).parent_path() / file), {}});
    while (std::getline(fields, value, ',')) frames.back().points.push_back(std::stof(value));
  }
  return frames;
}

std::vector<Detection> Detect(const Detector& detector, const cv::Mat& image) {
  // A minimum face of 30 pixels keeps the base image within the built-in scan
  // net's 384 pixels.
  const int longEdge = std::max(image.cols, image.rows);
  const CascadeParameter scan{1.0f, longEdge, 30.5f / static_cast<float>(longEdge), 30, 1.2f, 12};
  std::vector<Detection> detections;
  EXPECT_EQ(detect(Image{image.cols, image.rows, 0, image.data}, detector, detections, scan), STATUS_OK);
  return detections;
}

void ExpectSameFaces(const std::vector<Detection>& found, const std::vector<Detection>& expected) {
  ASSERT_EQ(found.size(), expected.size());
  for (size_t i = 0; i < found.size(); ++i) {
    const Rectangle<float>& a = found[i].box;
    const Rectangle<float>& b = expected[i].box;
    EXPECT_EQ((std::vector<float>{a.left, a.top, a.right, a.bottom, found[i].score}),
              (std::vector<float>{b.left, b.top, b.right, b.bottom, expected[i].score})) << i;
  }
}

// The shipped folder and the built-in cascade (which finds its weights at
// "../../../Tavi/public/cascades/...", so it is loaded from three folders
// below a folder linking to the project's) find the same faces.
class ShippedModelsTest : public testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(fromFolder_.load(DetectorParams(kModelRoot, "cascade.list")), STATUS_OK);
    TempDir dir;
    fs::create_directory_symlink(TAVI_SOURCE_DIR "/Tavi", dir.path() + "/Tavi");
    fs::create_directories(dir.path() + "/a/b/c");
    const fs::path before = fs::current_path();
    fs::current_path(dir.path() + "/a/b/c");
    const Status status = builtIn_.load();
    fs::current_path(before);
    ASSERT_EQ(status, STATUS_OK);
  }

  std::vector<Detection> DetectWithBoth(const cv::Mat& image) {
    const std::vector<Detection> faces = Detect(fromFolder_, image);
    ExpectSameFaces(Detect(builtIn_, image), faces);
    return faces;
  }

  Detector fromFolder_;
  Detector builtIn_;
};

TEST_F(ShippedModelsTest, ScanSettingsFitEachScanNetAndBothCascadesAgree) {
  Detector none;
  ScanSettings settings{};
  EXPECT_EQ(scanSettingsFor(none, 640, 480, 40, settings), STATUS_DETECTOR_NOT_READY);
  EXPECT_THROW(scanSettingsFor(fromFolder_, 0, 480, 40, settings), std::invalid_argument);
  EXPECT_THROW(scanSettingsFor(fromFolder_, 640, 480, 0, settings), std::invalid_argument);
  // A full-HD photo searched for faces of 40 pixels has a base image of 576
  // pixels: inside the shipped 640, beyond the built-in 384, where the
  // smallest face that fits is 1920 * 12 / 384 = 60.
  ASSERT_EQ(scanSettingsFor(fromFolder_, 1920, 1080, 40, settings), STATUS_OK);
  EXPECT_EQ(settings.minFace, 40);
  ASSERT_EQ(scanSettingsFor(builtIn_, 1920, 1080, 40, settings), STATUS_OK);
  EXPECT_EQ(settings.minFace, 60);
  const cv::Mat large(1080, 1920, CV_8UC3, cv::Scalar(90, 120, 150));
  std::vector<Detection> detections;
  EXPECT_EQ(detect(Image{large.cols, large.rows, 0, large.data}, builtIn_, detections, settings.params),
            STATUS_OK);

  EXPECT_FALSE(DetectWithBoth(cv::imread(TAVI_SOURCE_DIR "/samples/astronaut.png")).empty());
}

// One face found holds the middle of the held-out face (the inner eye
// corners, the nose tip and the lower lip), and the landmarks placed from the
// best box lie within 0.12 of the eye distance on average.
TEST_F(ShippedModelsTest, FindAndPlaceTheHeldOutFaces) {
  const std::vector<Frame> frames = ValidationFrames(4);
  if (frames.empty()) {
    GTEST_SKIP() << "no validation data at " << kValidationCsv;
  }
  ASSERT_EQ(loadSDMModel(kModelRoot, "landmarks.sdm"), STATUS_OK);
  for (const Frame& frame : frames) {
    ASSERT_FALSE(frame.pixels.empty());
    const std::vector<Detection> faces = DetectWithBoth(frame.pixels);
    ASSERT_FALSE(faces.empty());
    EXPECT_TRUE(std::any_of(faces.begin(), faces.end(), [&frame](const Detection& face) {
      const int middle[] = {39, 42, 30, 57};
      return std::all_of(std::begin(middle), std::end(middle), [&](int point) {
        const float x = frame.points[2 * point];
        const float y = frame.points[2 * point + 1];
        return x > face.box.left && x < face.box.right && y > face.box.top && y < face.box.bottom;
      });
    }));
    std::vector<float> points;
    const Image image{frame.pixels.cols, frame.pixels.rows, 0, frame.pixels.data};
    ASSERT_EQ(align68Points(image, faces[0].box, points), STATUS_OK);
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

// Threads that each load a detector and detect, beside threads aligning on
// the one landmark model, all get what one thread alone gets.
TEST_F(ShippedModelsTest, LoadsDetectionsAndAlignmentsOnManyThreadsAgreeWithOneThread) {
  const cv::Mat photo = cv::imread(TAVI_SOURCE_DIR "/samples/astronaut.png");
  const std::vector<Detection> expected = Detect(fromFolder_, photo);
  ASSERT_FALSE(expected.empty());
  ASSERT_EQ(loadSDMModel(kModelRoot, "landmarks.sdm"), STATUS_OK);
  const Image image{photo.cols, photo.rows, 0, photo.data};
  std::vector<float> expectedPoints;
  ASSERT_EQ(align68Points(image, expected[0].box, expectedPoints), STATUS_OK);
  std::vector<std::vector<Detection>> found(3);
  std::vector<std::vector<float>> points(3);
  std::vector<std::thread> threads;
  for (size_t t = 0; t < 3; ++t) {
    threads.emplace_back([&, t] {
      Detector detector;
      EXPECT_EQ(detector.load(DetectorParams(kModelRoot, "cascade.list")), STATUS_OK);
      found[t] = Detect(detector, photo);
    });
    threads.emplace_back([&, t] { align68Points(image, expected[0].box, points[t]); });
  }
  for (std::thread& thread : threads) thread.join();
  unloadSDMModel();
  for (size_t t = 0; t < 3; ++t) {
    ExpectSameFaces(found[t], expected);
    EXPECT_EQ(points[t], expectedPoints) << t;
  }
}

}  // namespace
}  // namespace tavilib
