#include <gtest/gtest.h>

#include <opencv2/imgcodecs.hpp>

#include <string>
#include <thread>
#include <vector>

#include "tavilib.h"

namespace tavilib {
namespace {

const char kModelRoot[] = TAVI_SOURCE_DIR "/Tavi/public/";
const char kSample[] = TAVI_SOURCE_DIR "/samples/astronaut.png";

std::vector<Detection> LoadAndDetect(const cv::Mat& photo) {
  Detector detector;
  EXPECT_EQ(detector.load(DetectorParams(kModelRoot, "cascade.list")), STATUS_OK);
  ScanSettings scan{};
  EXPECT_EQ(scanSettingsFor(detector, photo.cols, photo.rows, 40, scan), STATUS_OK);
  std::vector<Detection> faces;
  EXPECT_EQ(detect(Image{photo.cols, photo.rows, 0, photo.data}, detector, faces, scan.params),
            STATUS_OK);
  return faces;
}

// Threads that each load a detector and detect, beside threads aligning on
// the one landmark model, all get what one thread alone gets.
TEST(ConcurrencyTest, LoadsDetectionsAndAlignmentsOnManyThreadsAgreeWithOneThread) {
  const cv::Mat photo = cv::imread(kSample, cv::IMREAD_COLOR);
  ASSERT_FALSE(photo.empty());
  const std::vector<Detection> expected = LoadAndDetect(photo);
  ASSERT_FALSE(expected.empty());
  ASSERT_EQ(loadSDMModel(kModelRoot, "landmarks.sdm"), STATUS_OK);
  const Image image{photo.cols, photo.rows, 0, photo.data};
  std::vector<float> expectedPoints;
  ASSERT_EQ(align68Points(image, expected[0].box, expectedPoints), STATUS_OK);

  constexpr int kEach = 3;
  std::vector<std::vector<Detection>> found(kEach);
  std::vector<std::vector<float>> points(kEach);
  std::vector<std::thread> threads;
  for (int t = 0; t < kEach; ++t) {
    threads.emplace_back([&, t] { found[t] = LoadAndDetect(photo); });
    threads.emplace_back([&, t] { align68Points(image, expected[0].box, points[t]); });
  }
  for (std::thread& thread : threads) {
    thread.join();
  }
  unloadSDMModel();
  for (int t = 0; t < kEach; ++t) {
    ASSERT_EQ(found[t].size(), expected.size()) << t;
    for (size_t i = 0; i < expected.size(); ++i) {
      EXPECT_EQ(found[t][i].box.left, expected[i].box.left);
      EXPECT_EQ(found[t][i].box.bottom, expected[i].box.bottom);
      EXPECT_EQ(found[t][i].score, expected[i].score);
    }
    EXPECT_EQ(points[t], expectedPoints) << t;
  }
}

}  // namespace
}  // namespace tavilib
