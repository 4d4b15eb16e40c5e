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
  EXPECT_EQ(RunGenerator(dir.path()), 2);  // an argument missing
}

}  // namespace
