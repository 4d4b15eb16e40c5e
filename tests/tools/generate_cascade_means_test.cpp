#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>

#include "temp_dir.h"

namespace {

// The built-in mean tables come from the shipped model folder.
const char kShippedNote[] = "Tavi/public/cascades, trained by tools/train_detector --seed 1";

void WriteMeanFolder(const TempDir& dir, int stage2Count, const std::string& ending) {
  const std::pair<const char*, int> folders[] = {{"x32Net-x32-3Scales-200", 1728},
                                                 {"x16Net-demo", 432},
                                                 {"x32Net", 1728},
                                                 {"x64Net", stage2Count}};
  for (const auto& folder : folders) {
    std::string values;
    for (int i = 0; i < folder.second; ++i) {
      values += i ? " 128" : "128";
    }
    dir.write(std::string("cascades/") + folder.first + "/mean", values + ending);
  }
}

std::string ReadFile(const std::string& path) {
  std::ifstream file(path);
  std::stringstream contents;
  contents << file.rdbuf();
  return contents.str();
}

int RunGenerator(const std::string& arguments) {
  const std::string command = std::string(GENERATE_CASCADE_MEANS) + " " + arguments + " 2>/dev/null";
  return WEXITSTATUS(std::system(command.c_str()));
}

TEST(GenerateCascadeMeansTest, TheCommittedTablesAreTheToolsOutput) {
  TempDir dir;
  const std::string output = dir.path() + "/means.cpp";
  ASSERT_EQ(RunGenerator(std::string(TAVI_SOURCE_DIR) + "/Tavi/public/ " + output + " '" +
                         kShippedNote + "'"),
            0);
  EXPECT_EQ(ReadFile(output), ReadFile(TAVI_SOURCE_DIR "/Tavi/src/detector/default_cascade_means.cpp"))
      << "regenerate the tables with the tool instead of editing them";
}

TEST(GenerateCascadeMeansTest, RefusesIncompleteFoldersAndBadArguments) {
  TempDir dir;
  // Without white space after it, a file's last number is not read.
  WriteMeanFolder(dir, 6912, "");
  EXPECT_EQ(RunGenerator(dir.path() + " " + dir.path() + "/out.cpp note"), 1);
  WriteMeanFolder(dir, 6911, "\n");
  EXPECT_EQ(RunGenerator(dir.path() + " " + dir.path() + "/out.cpp note"), 1);
  EXPECT_EQ(RunGenerator(dir.path()), 2);
}

}  // namespace
