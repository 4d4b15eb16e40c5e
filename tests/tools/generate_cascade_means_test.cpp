#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>

#include "temp_dir.h"

namespace {

std::string ReadFile(const std::string& path) {
  std::stringstream contents;
  contents << std::ifstream(path).rdbuf();
  return contents.str();
}

int RunGenerator(const std::string& arguments) {
  const std::string command = std::string(GENERATE_CASCADE_MEANS) + " " + arguments + " 2>/dev/null";
  return WEXITSTATUS(std::system(command.c_str()));
}

TEST(GenerateCascadeMeansTest, TheCommittedTablesAreTheToolsOutput) {
  TempDir dir;
  const std::string output = dir.path() + "/means.cpp";
  const std::string note = "'Tavi/public/cascades, trained by tools/train_detector --seed 1'";
  ASSERT_EQ(RunGenerator(TAVI_SOURCE_DIR "/Tavi/public/ " + output + " " + note), 0);
  EXPECT_EQ(ReadFile(output), ReadFile(TAVI_SOURCE_DIR "/Tavi/src/detector/default_cascade_means.cpp"))
      << "regenerate the tables with the tool instead of editing them";
}

// A mean file one value short, or whose last number has no white space after
// it (and so is not read), is refused; so is a missing argument.
TEST(GenerateCascadeMeansTest, RefusesIncompleteFoldersAndBadArguments) {
  for (const auto& [stage2Count, ending] : {std::pair<int, const char*>{6912, ""}, {6911, "\n"}}) {
    TempDir dir;
    for (const auto& [folder, count] : {std::pair<const char*, int>{"x32Net-x32-3Scales-200", 1728},
                                        {"x16Net-demo", 432}, {"x32Net", 1728}, {"x64Net", stage2Count}}) {
      std::string values = "128";
      for (int i = 1; i < count; ++i) values += " 128";
      dir.write(std::string("cascades/") + folder + "/mean", values + ending);
    }
    EXPECT_EQ(RunGenerator(dir.path() + " " + dir.path() + "/out.cpp note"), 1) << stage2Count;
    EXPECT_EQ(RunGenerator(dir.path()), 2);
  }
}

}  // namespace
