#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <stdexcept>
#include <vector>

#include "test_cascade.h"

namespace tavilib {
namespace {

using namespace testing_cascade;

// The base image is 0.24 of the input, and a level-0 window 50 input pixels.
const CascadeParameter kParams{1.0f, 400, 0.125f, 3, 1.5f, 12};

bool Overlaps(const Detection& detection, const cv::Rect& patch) {
  return detection.box.left < patch.x + patch.width && patch.x < detection.box.right &&
         detection.box.top < patch.y + patch.height && patch.y < detection.box.bottom;
}

class DetectTest : public ::testing::Test {
 protected:
  void Load(const std::string& list, int calibrationClass) {
    folder_.addScanStage("scan", 200);
    folder_.addConstantStage("grade", 3.0f);
    folder_.addConstantStage("final", 4.0f);
    folder_.addCalibration(calibrationClass);
    folder_.writeList(list);
    ASSERT_EQ(detector_.load(folder_.params()), STATUS_OK);
  }

  TempDir dir_;
  TestModelFolder folder_{dir_};
  Detector detector_;
};

TEST_F(DetectTest, FindsABrightPatchAndAppends) {
  Load("scan 0.5\n", 0);
  const cv::Rect patch(200, 100, 60, 60);
  cv::Mat pixels = ImageWithPatch(400, 300, patch);
  std::vector<Detection> detections;
  ASSERT_EQ(detect(AsImage(pixels), detector_, detections, kParams), STATUS_OK);
  ASSERT_FALSE(detections.empty());
  for (const Detection& detection : detections) {
    EXPECT_TRUE(Overlaps(detection, patch));
    EXPECT_GT(detection.score, 0.5f);
    EXPECT_EQ(detection.box.right - detection.box.left, detection.box.bottom - detection.box.top);
  }
  for (size_t i = 1; i < detections.size(); ++i) {
    EXPECT_GE(detections[i - 1].score, detections[i].score);
  }

  const size_t first = detections.size();
  ASSERT_EQ(detect(AsImage(pixels), detector_, detections, kParams), STATUS_OK);
  ASSERT_EQ(detections.size(), 2 * first) << "a second call appends its own list";
  EXPECT_EQ(detections[first].box.left, detections[0].box.left);

  cv::Mat dark = ImageWithPatch(400, 300, cv::Rect(0, 0, 0, 0));
  std::vector<Detection> none;
  EXPECT_EQ(detect(AsImage(dark), detector_, none, kParams), STATUS_OK);
  EXPECT_TRUE(none.empty());
  CascadeParameter noLevels = kParams;
  noLevels.numScales = 0;
  EXPECT_EQ(detect(AsImage(pixels), detector_, none, noLevels), STATUS_OK);
  EXPECT_TRUE(none.empty());
}

TEST_F(DetectTest, RowsAreReadThroughTheStrideAndPaddingIsIgnored) {
  Load("scan 0.5\n", 0);
  cv::Mat pixels = ImageWithPatch(400, 300, cv::Rect(120, 40, 80, 70));
  cv::Mat padded(300, 400 * 3 + 13, CV_8UC1, cv::Scalar::all(255));
  cv::Mat inside(300, 400, CV_8UC3, padded.data, padded.step);
  pixels.copyTo(inside);
  std::vector<Detection> tight;
  std::vector<Detection> strided;
  ASSERT_EQ(detect(AsImage(pixels), detector_, tight, kParams), STATUS_OK);
  ASSERT_EQ(detect(Image{400, 300, 400 * 3 + 13, padded.data}, detector_, strided, kParams),
            STATUS_OK);
  ASSERT_EQ(tight.size(), strided.size());
  ASSERT_FALSE(tight.empty());
  for (size_t i = 0; i < tight.size(); ++i) {
    EXPECT_EQ(tight[i].box.left, strided[i].box.left);
    EXPECT_EQ(tight[i].box.top, strided[i].box.top);
    EXPECT_EQ(tight[i].score, strided[i].score);
  }
}

TEST_F(DetectTest, ThreeStagesCalibrateTheMiddleOne) {
  Load("scan 0.5\ngrade 0.8\nfinal 0.9\n", 4);
  // One pyramid level, so that every window is 50 pixels wide and moves left
  // by trunc(4 / 24 * 50) = 8.
  CascadeParameter oneLevel = kParams;
  oneLevel.numScales = 1;
  cv::Mat pixels = ImageWithPatch(400, 300, cv::Rect(200, 100, 60, 60));
  std::vector<Detection> moved;
  ASSERT_EQ(detect(AsImage(pixels), detector_, moved, oneLevel), STATUS_OK);

  Detector still;
  TempDir otherDir;
  TestModelFolder other(otherDir);
  other.addScanStage("scan", 200);
  other.addConstantStage("grade", 3.0f);
  other.addConstantStage("final", 4.0f);
  other.addCalibration(0);
  other.writeList("scan 0.5\ngrade 0.8\nfinal 0.9\n");
  ASSERT_EQ(still.load(other.params()), STATUS_OK);
  std::vector<Detection> unmoved;
  ASSERT_EQ(detect(AsImage(pixels), still, unmoved, oneLevel), STATUS_OK);

  ASSERT_FALSE(unmoved.empty());
  ASSERT_EQ(moved.size(), unmoved.size());
  for (size_t i = 0; i < moved.size(); ++i) {
    EXPECT_EQ(moved[i].box.left, unmoved[i].box.left - 8);
    EXPECT_EQ(moved[i].box.top, unmoved[i].box.top);
    EXPECT_FLOAT_EQ(moved[i].score, 1.0f / (1.0f + std::exp(-4.0f))) << "the last stage's score";
  }
}

TEST_F(DetectTest, ImagesWithoutPixelsRaiseTheImageLibrarysException) {
  Load("scan 0.5\n", 0);
  std::vector<Detection> detections(2);
  EXPECT_THROW(detect(Image{40, 30, 0, nullptr}, detector_, detections, kParams), cv::Exception);
  cv::Mat pixels = ImageWithPatch(40, 30, cv::Rect(0, 0, 1, 1));
  EXPECT_THROW(detect(Image{0, 30, 0, pixels.data}, detector_, detections, kParams),
               cv::Exception);
  EXPECT_EQ(detections.size(), 2u);
}

// Strides and scan settings a host can get wrong are refused before any
// pixel is read or any buffer written.
TEST_F(DetectTest, StridesAndScanSettingsOutsideTheContractAreRefused) {
  Load("scan 0.5\n", 0);
  cv::Mat pixels = ImageWithPatch(400, 300, cv::Rect(100, 100, 60, 60));
  std::vector<Detection> detections(1);
  for (int32_t stride : {-1200, 5, 1199}) {
    EXPECT_THROW(detect(Image{400, 300, stride, pixels.data}, detector_, detections, kParams),
                 std::invalid_argument) << stride;
  }
  const float nan = std::numeric_limits<float>::quiet_NaN();
  const CascadeParameter wrong[] = {
      {1.0f, 0, 0.125f, 3, 1.5f, 12},   {1.0f, 400, 0.0f, 3, 1.5f, 12},
      {1.0f, 400, nan, 3, 1.5f, 12},    {1.0f, 400, 1e-9f, 3, 1.5f, 12},
      {1.0f, 400, 1e30f, 3, 1.5f, 12},  {1.0f, 400, 0.125f, 3, nan, 12},
      {1.0f, 400, 0.125f, 3, 1.0f, 12}, {1.0f, 400, 0.125f, 3, 1.5f, 0},
      {0.0f, 400, 0.125f, 3, 1.5f, 12},
      // A base image of 1200 by 900 against the scan net's 200 by 200.
      {1.0f, 400, 0.01f, 3, 1.5f, 12}};
  for (const CascadeParameter& params : wrong) {
    EXPECT_THROW(detect(AsImage(pixels), detector_, detections, params), std::invalid_argument)
        << params.normalizedSize << " " << params.minFaceRatio << " " << params.scaleStep;
  }
  EXPECT_EQ(detections.size(), 1u);
}

}  // namespace
}  // namespace tavilib
