#include <gtest/gtest.h>

#include <nlohmann/json.hpp>
#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <sstream>
#include <string>
#include <vector>

#include "temp_dir.h"

namespace {

namespace fs = std::filesystem;

const std::string kSample = TAVI_SOURCE_DIR "/samples/astronaut.png";

struct ToolRun {
  int status;
  std::string output;
};

ToolRun RunTool(const std::string& arguments) {
  const std::string command = std::string(TAVI_TOOL) + " " + arguments + " 2>/dev/null";
  FILE* pipe = popen(command.c_str(), "r");
  std::string output;
  char buffer[4096];
  for (size_t got; (got = fread(buffer, 1, sizeof buffer, pipe)) > 0;) output.append(buffer, got);
  return {WEXITSTATUS(pclose(pipe)), output};
}

std::vector<nlohmann::json> JsonLines(const std::string& output) {
  std::vector<nlohmann::json> lines;
  std::istringstream stream(output);
  for (std::string line; std::getline(stream, line);) lines.push_back(nlohmann::json::parse(line));
  return lines;
}

// A folder of the sample in several forms, with files that are no images.
void WriteMixedFolder(const TempDir& dir) {
  const cv::Mat colour = cv::imread(kSample, cv::IMREAD_COLOR);
  cv::Mat grey, alpha;
  cv::cvtColor(colour, grey, cv::COLOR_BGR2GRAY);
  cv::cvtColor(colour, alpha, cv::COLOR_BGR2BGRA);
  std::vector<uchar> jpeg;
  cv::imencode(".jpg", colour, jpeg);
  dir.write("in/d-photo.jpg", std::string(jpeg.begin(), jpeg.end()));
  dir.write("in/e-cut.jpg", std::string(jpeg.begin(), jpeg.begin() + 600));
  dir.write("in/f-notes.txt", "not a photo\n");
  fs::create_directories(dir.path() + "/in/inner");
  cv::imwrite(dir.path() + "/in/a,\"colour\".png", colour);
  cv::imwrite(dir.path() + "/in/b-grey.png", grey);
  cv::imwrite(dir.path() + "/in/inner/c-alpha.png", alpha);
}

TEST(TaviToolTest, ReportsEveryFileOfAMixedFolderInOrderAndDrawsWhole) {
  TempDir dir;
  const std::string input = dir.path() + "/in";
  const std::string drawn = dir.path() + "/drawn";
  WriteMixedFolder(dir);
  const ToolRun run = RunTool("detect --landmarks 68 --threads 2 --draw " + drawn + " " + input +
                          " " + dir.path() + "/absent.png");
  EXPECT_EQ(run.status, 1);
  const std::vector<nlohmann::json> lines = JsonLines(run.output);
  const std::vector<std::string> names = {"a,\"colour\".png", "b-grey.png", "d-photo.jpg", "e-cut.jpg",
                                          "f-notes.txt", "inner/c-alpha.png", "absent.png"};
  ASSERT_EQ(lines.size(), names.size());
  for (size_t i = 0; i < names.size(); ++i) {
    EXPECT_EQ(fs::path(lines[i]["file"].get<std::string>()).filename(), fs::path(names[i]).filename());
  }
  // The four readable forms of the sample each give its face first, with 68
  // points (the grey copy also a false one, on the ring of the suit's collar).
  for (size_t i : {0, 1, 2, 5}) {
    ASSERT_EQ(lines[i]["width"], 512) << names[i];
    ASSERT_EQ(lines[i]["faces"].size(), i == 1 ? 2u : 1u) << names[i];
    EXPECT_EQ(lines[i]["faces"][0]["points"].size(), 68u) << names[i];
    const auto box = lines[i]["faces"][0]["box"].get<std::vector<float>>();
    EXPECT_NEAR(box[0], 170, 20) << names[i];
    EXPECT_NEAR(box[3], 170, 20) << names[i];
    EXPECT_TRUE(fs::exists(drawn + "/" + names[i])) << names[i];
  }
  for (size_t i : {3, 4}) EXPECT_EQ(lines[i]["error"], "not an image OpenCV can decode") << names[i];
  EXPECT_EQ(lines[6]["error"], "no such file");
  for (const auto& entry : fs::recursive_directory_iterator(drawn)) {
    EXPECT_EQ(entry.path().string().find(".partial"), std::string::npos) << entry.path();
  }

  // One thread gives the same lines; CSV quotes the name holding a comma and
  // doubles its quotes.
  const ToolRun single = RunTool("detect --landmarks 68 " + input);
  EXPECT_EQ(single.output.substr(0, single.output.find("e-cut")),
            run.output.substr(0, run.output.find("e-cut")));
  const ToolRun csv = RunTool("detect --csv --landmarks 5 '" + input + "/a,\"colour\".png'");
  EXPECT_EQ(csv.status, 0);
  EXPECT_EQ(csv.output.find("file,width,height,min_face,face,left,top,right,bottom,score,x0,y0,"), 0u);
  EXPECT_NE(csv.output.find("\n\"" + input + "/a,\"\"colour\"\".png\",512,512,40,0,"), std::string::npos);
}

TEST(TaviToolTest, RefusesBadOptionsAndBrokenModelsBeforeAnyImage) {
  TempDir dir;
  EXPECT_EQ(RunTool("detect --landmarks 7 " + kSample).status, 2);
  EXPECT_EQ(RunTool("find " + kSample).status, 2);
  EXPECT_EQ(RunTool("detect").status, 2);
  const ToolRun broken = RunTool("detect --models " + dir.path() + " " + kSample);
  EXPECT_EQ(broken.status, 2);
  EXPECT_EQ(broken.output, "");
}

}  // namespace
