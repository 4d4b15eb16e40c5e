// The list, mean and offsets files of a model folder, split from the input
// at "|||": a folder the check passes must load and detect on a fixed image
// without a crash; the check itself never ends the process.
#include <cstddef>
#include <cstdint>
#include <string>

#include <google/protobuf/stubs/logging.h>
#include <vector>

#include "tavilib.h"
#include "temp_dir.h"
#include "test_cascade.h"

namespace {

std::vector<std::string> splitParts(const std::string& input) {
  std::vector<std::string> parts;
  size_t from = 0;
  for (size_t at; parts.size() < 2 && (at = input.find("|||", from)) != std::string::npos; from = at + 3) {
    parts.push_back(input.substr(from, at - from));
  }
  parts.push_back(input.substr(from));
  parts.resize(3);
  return parts;
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  // Parse errors are expected by the thousand; their log lines would drown
  // the fuzzer's own.
  google::protobuf::SetLogHandler(nullptr);
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using tavilib::testing_cascade::TestModelFolder;
  static const TempDir dir;
  static TestModelFolder folder(dir);
  static const bool built = [] {
    folder.addScanStage("scan");
    folder.addConstantStage("grade", {0.0f, 3.0f});
    folder.addCalibration(4);
    return true;
  }();
  (void)built;
  const std::vector<std::string> parts =
      splitParts(std::string(reinterpret_cast<const char*>(data), size));
  folder.writeList(parts[0]);
  dir.write("grade/mean", parts[1]);
  dir.write("cascades/x32Net-x32-3Scales-200/offsets-scales", parts[2]);

  std::string message;
  const tavilib::DetectorParams params = folder.params();
  if (tavilib::checkDetectorModel(params, message) != tavilib::STATUS_OK) {
    return 0;
  }
  tavilib::Detector detector;
  if (detector.load(params) != tavilib::STATUS_OK) {
    return 0;
  }
  const cv::Mat image = tavilib::testing_cascade::ImageWithPatch(100, 80, cv::Rect(30, 20, 40, 40));
  tavilib::ScanSettings scan{};
  tavilib::scanSettingsFor(detector, image.cols, image.rows, 20, scan);
  std::vector<tavilib::Detection> faces;
  tavilib::detect(tavilib::Image{image.cols, image.rows, 0, image.data}, detector, faces, scan.params);
  return 0;
}
