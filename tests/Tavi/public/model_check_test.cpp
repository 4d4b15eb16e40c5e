#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
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

void WriteFile(const std::string& path, const std::string& bytes) {
  std::ofstream(path, std::ios::binary | std::ios::trunc) << bytes;
}

TEST(ModelCheckTest, NamesTheFirstFaultOfABrokenCascadeFolder) {
  std::string message = "stale";
  EXPECT_EQ(checkDetectorModel(DetectorParams(kModelRoot.c_str(), "cascade.list"), message), STATUS_OK);
  EXPECT_EQ(message, "");

  struct Fault {
    std::function<void(const std::string&)> make;  // applied to the copy's root
    std::string message;                           // behind the root
  };
  const std::vector<Fault> faults = {
      {[](const std::string& r) { fs::remove(r + "cascade.list"); },
       "cascade.list: missing or not a file"},
      {[](const std::string& r) { WriteFile(r + "cascade.list", "cascades/x16Net-demo 0.4"); },
       "cascade.list: the last line has no newline and would be ignored"},
      {[](const std::string& r) { WriteFile(r + "cascade.list", "# nothing\n"); },
       "cascade.list: names no stage"},
      {[](const std::string& r) { WriteFile(r + "cascade.list", "cascades/x16Net-demo\n"); },
       "cascade.list:1: needs a stage folder and a threshold"},
      {[](const std::string& r) {
         WriteFile(r + "cascade.list", "cascades/x16Net-demo 0.4\ncascades/x32Net 0.8\n\n");
       },
       "cascade.list:3: needs a stage folder and a threshold"},
      {[](const std::string& r) {
         fs::remove(r + "cascades/x32Net/prototxt-deploy");
         fs::create_directory(r + "cascades/x32Net/prototxt-deploy");
       },
       "cascades/x32Net/prototxt-deploy: missing or not a file"},
      {[](const std::string& r) { WriteFile(r + "cascades/x32Net/prototxt-deploy", "layers {"); },
       "cascades/x32Net/prototxt-deploy: not a network description"},
      {[](const std::string& r) {
         fs::copy_file(r + "cascades/x64Net/proto", r + "cascades/x32Net/proto",
                       fs::copy_options::overwrite_existing);
       },
       "cascades/x32Net/proto: blob 0 of layer \"fcf\" is not of the shape its description gives"},
      {[](const std::string& r) {
         const std::string mean = ReadFile(r + "cascades/x64Net/mean");
         WriteFile(r + "cascades/x64Net/mean", mean.substr(0, mean.find_last_not_of(" \n\t") + 1));
       },
       "cascades/x64Net/mean: must end in white space, or its last number is lost"},
      {[](const std::string& r) { WriteFile(r + "cascades/x32Net/mean", "1 2 3\n"); },
       "cascades/x32Net/mean: holds 3 numbers where the net's input has 1728"},
      {[](const std::string& r) { fs::remove(r + "cascades/x32Net-x32-3Scales-200/proto"); },
       "cascades/x32Net-x32-3Scales-200//proto: missing or not a file"},
      {[](const std::string& r) {
         WriteFile(r + "cascades/x32Net-x32-3Scales-200/offsets-scales", "0 0 1\n2000000000 0 1\n");
       },
       "cascades/x32Net-x32-3Scales-200//offsets-scales: row 2 needs a scale from 0.01 to 100 and "
       "offsets within the net's input"},
  };
  for (const Fault& fault : faults) {
    TempDir dir;
    const std::string root = dir.path() + "/";
    fs::copy(kModelRoot + "cascades", root + "cascades", fs::copy_options::recursive);
    fs::copy_file(kModelRoot + "cascade.list", root + "cascade.list");
    fault.make(root);
    EXPECT_EQ(checkDetectorModel(DetectorParams(root.c_str(), "cascade.list"), message),
              STATUS_MODEL_LOAD_FAILED);
    EXPECT_EQ(message, root + fault.message);
  }
}

TEST(ModelCheckTest, NamesTheFaultOfABrokenLandmarkModel) {
  const std::string shipped = ReadFile(kModelRoot + "landmarks.sdm");
  std::string message = "stale";
  EXPECT_EQ(checkSDMModel(kModelRoot, "landmarks.sdm", message), STATUS_OK);
  EXPECT_EQ(message, "");

  // The file ends in the stage levels, the discarded word, the model flag,
  // the scales per octave and the face width.
  auto withWordFromEnd = [&shipped](size_t wordsFromEnd, int32_t value) {
    std::string bytes = shipped;
    std::memcpy(&bytes[bytes.size() - 4 * wordsFromEnd], &value, 4);
    return bytes;
  };
  auto withWordFromStart = [&shipped](size_t word, int32_t value) {
    std::string bytes = shipped;
    std::memcpy(&bytes[4 * word], &value, 4);
    return bytes;
  };
  const std::vector<std::pair<std::string, std::string>> faults = {
      {shipped.substr(0, 64), "cut short before its stages"},
      {shipped.substr(0, shipped.size() - 2), "cut short"},
      {shipped + "tail", "4 bytes after the model"},
      {withWordFromEnd(2, -3), "scales per octave must be 1 to 16"},
      {withWordFromEnd(1, 0), "the face width must be 8 to 1024 pixels"},
      {withWordFromEnd(5, 9), "a stage level outside 0 to 5"},
      {std::string(), "cut short before its stages"},
      // Found by fuzzing: a negative count of stage matrices.
      {withWordFromStart(0, -1), "cut short before its stages"},
  };
  TempDir dir;
  for (const auto& [bytes, fault] : faults) {
    WriteFile(dir.path() + "/model.sdm", bytes);
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
