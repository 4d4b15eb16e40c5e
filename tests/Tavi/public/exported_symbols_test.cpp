#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdio>
#include <memory>
#include <string>
#include <vector>

namespace {

// The demangled names of the symbols libtavi.so defines in its dynamic table.
std::vector<std::string> ExportedSymbols() {
  const std::string command = std::string("nm -D --defined-only -C ") + TAVI_LIBRARY_PATH;
  std::unique_ptr<FILE, int (*)(FILE*)> pipe(popen(command.c_str(), "r"), pclose);
  EXPECT_NE(pipe, nullptr);
  std::vector<std::string> names;
  char line[4096];
  while (pipe && std::fgets(line, sizeof line, pipe.get())) {
    // "<address> <type> <name>"
    std::string entry(line);
    entry.erase(entry.find_last_not_of('\n') + 1);
    const size_t name_start = entry.find(' ', entry.find(' ') + 1);
    names.push_back(entry.substr(name_start + 1));
  }
  return names;
}

TEST(ExportedSymbolsTest, OnlyTheTavilibInterfaceLeavesTheLibrary) {
  const std::vector<std::string> names = ExportedSymbols();
  ASSERT_FALSE(names.empty());
  for (const std::string& name : names) {
    EXPECT_THAT(name, testing::StartsWith("tavilib::"));
  }
  EXPECT_THAT(names, testing::Contains(testing::StartsWith(
                         "tavilib::detect(tavilib::Image const&, tavilib::Detector const&, "
                         "std::vector<tavilib::Detection")));
  EXPECT_THAT(names, testing::Contains("tavilib::loadDetector(tavilib::Detector&)"));
  EXPECT_THAT(names, testing::Contains(
                         "tavilib::loadDetector(tavilib::Detector&, tavilib::DetectorParams const&)"));
  EXPECT_THAT(names, testing::Contains("tavilib::unloadDetector(tavilib::Detector&)"));
  EXPECT_THAT(names, testing::Contains("tavilib::Detector::load()"));
  EXPECT_THAT(names, testing::Contains("tavilib::Detector::operator=(tavilib::Detector const&)"));
  EXPECT_THAT(names, testing::Contains("tavilib::Detector::getDetector() const"));
  EXPECT_THAT(names, testing::Contains("tavilib::DetectorParams::DetectorParams(char const* const&, "
                                       "char const* const&)"));
  EXPECT_THAT(names, testing::Contains("tavilib::scanSettingsFor(tavilib::Detector const&, int, int, "
                                       "int, tavilib::ScanSettings&)"));
  EXPECT_THAT(names, testing::Contains(testing::StartsWith(
                         "tavilib::checkDetectorModel(tavilib::DetectorParams const&, std::")));
  EXPECT_THAT(names, testing::Contains(testing::StartsWith("tavilib::checkSDMModel(std::")));
  EXPECT_THAT(names, testing::Contains(testing::StartsWith("tavilib::loadSDMModel(std::")));
  EXPECT_THAT(names, testing::Contains("tavilib::unloadSDMModel()"));
  EXPECT_THAT(names, testing::Contains(testing::StartsWith(
                         "tavilib::align68Points(tavilib::Image const&, "
                         "tavilib::Rectangle<float> const&, std::vector<float")));
  EXPECT_THAT(names, testing::Contains(testing::StartsWith(
                         "tavilib::align5Points(tavilib::Image const&, "
                         "tavilib::Rectangle<float> const&, std::vector<float")));
}

}  // namespace
