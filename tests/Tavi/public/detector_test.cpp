#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdio>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "tavilib.h"

namespace tavilib {
namespace {

TEST(DetectorTest, ParamsBorrowTheirPointersAndAFailedLoadLeavesAStateThatCopiesShare) {
  const DetectorParams empty;
  EXPECT_STREQ(empty.cascadeRoot, "");
  EXPECT_EQ(empty.cascadeRoot, empty.cascadeList) << "both point to one empty string";
  const char* root = "models/";
  const DetectorParams params(root, "cascade.list");
  EXPECT_EQ(params.cascadeRoot, root);
  EXPECT_EQ(empty.reserved, 1);
  EXPECT_EQ(params.reserved, 1);

  Detector detector;
  EXPECT_EQ(detector.getDetector(), nullptr);
  unloadDetector(detector);  // harmless when empty
  std::vector<unsigned char> pixels(30 * 20 * 3, 128);
  const CascadeParameter scan{1.0f, 320, 0.1f, 3, 1.5f, 12};
  std::vector<Detection> detections(3);
  EXPECT_EQ(detect(Image{30, 20, 0, pixels.data()}, detector, detections, scan), STATUS_DETECTOR_NOT_READY);
  EXPECT_EQ(detections.size(), 3u);
  // A failed load leaves a state, which copies share.
  EXPECT_EQ(loadDetector(detector, empty), STATUS_MODEL_LOAD_FAILED);
  EXPECT_TRUE(detector.is_loaded());
  Detector copy;
  copy = detector;
  EXPECT_EQ(copy.getDetector(), detector.getDetector());
  // Each copy would delete the shared state: let only one of them do it.
  copy.unload();
  EXPECT_FALSE(copy.is_loaded());
  EXPECT_EQ(copy.getDetector(), nullptr);
  detector = Detector();
}

// What libtavi.so defines in its dynamic table, demangled.
TEST(ExportedSymbolsTest, OnlyTheTavilibInterfaceLeavesTheLibrary) {
  const std::string command = std::string("nm -D --defined-only -C ") + TAVI_LIBRARY_PATH + "|cut -d' ' -f3-";
  std::unique_ptr<FILE, int (*)(FILE*)> pipe(popen(command.c_str(), "r"), pclose);
  ASSERT_NE(pipe, nullptr);
  std::vector<std::string> names;
  for (char line[4096]; std::fgets(line, sizeof line, pipe.get());) {
    names.emplace_back(line, std::strcspn(line, "\n"));
    EXPECT_THAT(names.back(), testing::StartsWith("tavilib::"));
  }
  ASSERT_FALSE(names.empty());
  for (const char* entry : {
           "tavilib::detect(tavilib::Image const&, tavilib::Detector const&, "
           "std::vector<tavilib::Detection",
           "tavilib::loadDetector(tavilib::Detector&)",
           "tavilib::loadDetector(tavilib::Detector&, tavilib::DetectorParams const&)",
           "tavilib::unloadDetector(tavilib::Detector&)", "tavilib::Detector::load()",
           "tavilib::Detector::operator=(tavilib::Detector const&)",
           "tavilib::Detector::getDetector() const",
           "tavilib::DetectorParams::DetectorParams(char const* const&, char const* const&)",
           "tavilib::scanSettingsFor(tavilib::Detector const&, int, int, int, tavilib::ScanSettings&)",
           "tavilib::checkDetectorModel(tavilib::DetectorParams const&, std::",
           "tavilib::checkSDMModel(std::", "tavilib::loadSDMModel(std::", "tavilib::unloadSDMModel()",
           "tavilib::align68Points(tavilib::Image const&, tavilib::Rectangle<float> const&, "
           "std::vector<float",
           "tavilib::align5Points(tavilib::Image const&, tavilib::Rectangle<float> const&, "
           "std::vector<float"}) {
    EXPECT_THAT(names, testing::Contains(testing::StartsWith(entry)));
  }
}

}  // namespace
}  // namespace tavilib
