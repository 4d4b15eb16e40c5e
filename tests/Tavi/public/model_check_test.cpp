#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "tavilib.h"
#include "temp_dir.h"

namespace tavilib {
namespace {

namespace fs = std::filesystem;

const std::string kModelRoot = TAVI_SOURCE_DIR "/Tavi/public/";

std::string ReadFile(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return std::string((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
}

// Each broken copy of the shipped folder is named by the file (and line or
// row) at fault and what is wrong there.
TEST(ModelCheckTest, NamesTheFirstFaultOfABrokenCascadeFolder) {
  std::string message = "stale";
  EXPECT_EQ(checkDetectorModel(DetectorParams(kModelRoot.c_str(), "cascade.list"), message), STATUS_OK);
  EXPECT_EQ(message, "");

  const std::string kRemove = "<remove>";
  const std::string kFolder = "<folder>";
  const std::string x64Mean = ReadFile(kModelRoot + "cascades/x64Net/mean");
  const struct { std::string file, contents, message; } faults[] = {
      {"cascade.list", kRemove, "cascade.list: missing"},
      {"cascade.list", "cascades/x16Net-demo 0.4", "cascade.list: the last line has no newline"},
      {"cascade.list", "# nothing\n", "cascade.list: names no stage"},
      {"cascade.list", "cascades/x16Net-demo 0.4\ncascades/x32Net 0.8\n\n",
       "cascade.list:3: needs a stage folder and a threshold"},
      {"cascades/x32Net/prototxt-deploy", kFolder, "cascades/x32Net/prototxt-deploy: missing"},
      {"cascades/x32Net/prototxt-deploy", "layers {", "cascades/x32Net/prototxt-deploy: not a network"},
      {"cascades/x32Net/proto", ReadFile(kModelRoot + "cascades/x64Net/proto"),
       "cascades/x32Net/proto: blob 0 of layer \"fcf\" is not of the shape"},
      {"cascades/x64Net/mean", x64Mean.substr(0, x64Mean.find_last_not_of(" \n\t") + 1),
       "cascades/x64Net/mean: must end in white space"},
      {"cascades/x32Net/mean", "1 2 3\n",
       "cascades/x32Net/mean: holds 3 numbers where the net's input has 1728"},
      {"cascades/x32Net-x32-3Scales-200/proto", kRemove, "cascades/x32Net-x32-3Scales-200//proto: missing"},
      {"cascades/x32Net-x32-3Scales-200/offsets-scales", "0 0 1\n2000000000 0 1\n",
       "cascades/x32Net-x32-3Scales-200//offsets-scales: row 2 needs a scale from 0.01 to 100"},
  };
  for (const auto& fault : faults) {
    TempDir dir;
    const std::string root = dir.path() + "/";
    fs::copy(kModelRoot + "cascades", root + "cascades", fs::copy_options::recursive);
    fs::copy_file(kModelRoot + "cascade.list", root + "cascade.list");
    fs::remove(root + fault.file);
    if (fault.contents == kFolder) fs::create_directory(root + fault.file);
    if (fault.contents != kRemove && fault.contents != kFolder) dir.write(fault.file, fault.contents);
    EXPECT_EQ(checkDetectorModel(DetectorParams(root.c_str(), "cascade.list"), message),
              STATUS_MODEL_LOAD_FAILED);
    EXPECT_EQ(message.substr(0, root.size() + fault.message.size()), root + fault.message);
  }
}

TEST(ModelCheckTest, NamesTheFaultOfABrokenLandmarkModel) {
  const std::string shipped = ReadFile(kModelRoot + "landmarks.sdm");
  std::string message = "stale";
  EXPECT_EQ(checkSDMModel(kModelRoot, "landmarks.sdm", message), STATUS_OK);
  EXPECT_EQ(message, "");

  // The file ends in the stage levels, the discarded word, the model flag,
  // the scales per octave and the face width.
  auto withWord = [&shipped](size_t offset, int32_t value) {
    std::string bytes = shipped;
    std::memcpy(&bytes[offset], &value, 4);
    return bytes;
  };
  const size_t end = shipped.size();
  const std::vector<std::pair<std::string, std::string>> faults = {
      {shipped.substr(0, 64), "cut short before its stages"},
      {shipped.substr(0, end - 2), "cut short"},
      {shipped + "tail", "4 bytes after the model"},
      {withWord(end - 8, -3), "scales per octave must be 1 to 16"},
      {withWord(end - 4, 0), "the face width must be 8 to 1024 pixels"},
      {withWord(end - 20, 9), "a stage level outside 0 to 5"},
      {std::string(), "cut short before its stages"},
      // Found by fuzzing: a negative count of stage matrices.
      {withWord(0, -1), "cut short before its stages"},
  };
  TempDir dir;
  for (const auto& [bytes, fault] : faults) {
    dir.write("model.sdm", bytes);
    EXPECT_EQ(checkSDMModel(dir.path(), "model.sdm", message), STATUS_MODEL_LOAD_FAILED);
    EXPECT_EQ(message, dir.path() + "/model.sdm: " + fault);
    // All but trailing bytes also keep the model from loading.
    EXPECT_EQ(loadSDMModel(dir.path(), "model.sdm") == STATUS_OK, bytes == shipped + "tail");
  }
  unloadSDMModel();
  EXPECT_EQ(checkSDMModel(dir.path(), "absent.sdm", message), STATUS_MODEL_LOAD_FAILED);
  EXPECT_EQ(message, dir.path() + "/absent.sdm: missing or not a file");
}

}  // namespace
}  // namespace tavilib
