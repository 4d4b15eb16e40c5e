#include <gtest/gtest.h>

#include <vector>

#include "tavilib.h"

namespace tavilib {
namespace {

TEST(DetectorParamsTest, ConstructorsBorrowThePointersAndSetReserved) {
  const DetectorParams empty;
  EXPECT_STREQ(empty.cascadeRoot, "");
  EXPECT_EQ(empty.cascadeRoot, empty.cascadeList) << "both point to one empty string";
  EXPECT_EQ(empty.reserved, 1);

  const char* root = "models/";
  const char* list = "cascade.list";
  DetectorParams params(root, list);
  EXPECT_EQ(params.reserved, 1);
  params.reserved = 7;
  DetectorParams assigned;
  assigned = params;
  for (const DetectorParams& copy : {DetectorParams(params), assigned}) {
    EXPECT_EQ(copy.cascadeRoot, root);
    EXPECT_EQ(copy.cascadeList, list);
    EXPECT_EQ(copy.reserved, 7);
  }
}

TEST(DetectorTest, FailedLoadLeavesAStateThatRefusesToDetectAndCopiesShareIt) {
  Detector detector;
  EXPECT_FALSE(detector.is_loaded());
  EXPECT_EQ(detector.getDetector(), nullptr);
  unloadDetector(detector);  // harmless when empty
  std::vector<unsigned char> pixels(30 * 20 * 3, 128);
  const Image image{30, 20, 0, pixels.data()};
  const CascadeParameter params{1.0f, 320, 0.1f, 3, 1.5f, 12};
  std::vector<Detection> detections(3);
  EXPECT_EQ(detect(image, detector, detections, params), STATUS_DETECTOR_NOT_READY);

  EXPECT_EQ(loadDetector(detector, DetectorParams()), STATUS_MODEL_LOAD_FAILED);
  EXPECT_TRUE(detector.is_loaded());
  EXPECT_NE(detector.getDetector(), nullptr);
  EXPECT_EQ(detect(image, detector, detections, params), STATUS_DETECTOR_NOT_READY);
  EXPECT_EQ(detections.size(), 3u);

  Detector copy;
  copy = detector;
  EXPECT_EQ(copy.getDetector(), detector.getDetector());
  // Each copy would delete the shared state: let only one of them do it.
  copy.unload();
  EXPECT_FALSE(copy.is_loaded());
  EXPECT_EQ(copy.getDetector(), nullptr);
  detector = Detector();
}

}  // namespace
}  // namespace tavilib
