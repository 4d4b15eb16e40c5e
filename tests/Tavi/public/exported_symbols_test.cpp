#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdio>
#include <memory>
#include <string>
#include <vector>

namespace {

using testing::Contains;
using testing::StartsWith;

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
    names.push_back(entry.substr(entry.find(' ', entry.find(' ') + 1) + 1));
  }
  return names;
}

TEST(ExportedSymbolsTest, OnlyTheTavilibInterfaceLeavesTheLibrary) {
  const std::vector<std::string> names = ExportedSymbols();
  ASSERT_FALSE(names.empty());
  for (const std::string& name : names) {
    EXPECT_THAT(name, StartsWith("tavilib::"));
  }
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
    EXPECT_THAT(names, Contains(StartsWith(entry)));
  }
}

}  // namespace
