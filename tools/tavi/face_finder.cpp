#include "tavi/face_finder.h"

#include <opencv2/imgcodecs.hpp>

#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "tavi/annotation.h"

namespace tavi {

namespace {

// Why a file gave no image: unreadable, or not an image OpenCV decodes.
std::string decodeError(const std::string& path) {
  std::error_code error;
  if (!std::filesystem::exists(path, error)) {
    return "no such file";
  }
  if (!std::ifstream(path, std::ios::binary).good()) {
    return "cannot be read";
  }
  return "not an image OpenCV can decode";
}

}  // namespace

FaceFinder::FaceFinder(const FinderSettings& settings) : settings_(settings) {
  const std::string list = "cascade.list";
  if (detector_.load(tavilib::DetectorParams(settings_.models.c_str(), list.c_str())) != tavilib::STATUS_OK) {
    throw std::runtime_error("the cascade in " + settings_.models + " did not load");
  }
}

ImageReport FaceFinder::process(const ImageInput& input) {
  ImageReport report;
  report.file = input.path;
  // IMREAD_COLOR gives three 8-bit channels for grey, alpha and 16-bit files.
  const cv::Mat image = cv::imread(input.path, cv::IMREAD_COLOR);
  if (image.empty()) {
    report.error = decodeError(input.path);
    return report;
  }
  report.width = image.cols;
  report.height = image.rows;
  tavilib::ScanSettings scan{};
  tavilib::scanSettingsFor(detector_, image.cols, image.rows, settings_.minFace, scan);
  report.minFace = scan.minFace;
  const tavilib::Image wrapped{image.cols, image.rows, static_cast<int32_t>(image.step), image.data};
  std::vector<tavilib::Detection> detections;
  tavilib::detect(wrapped, detector_, detections, scan.params);
  for (const tavilib::Detection& detection : detections) {
    FoundFace face{detection.box, detection.score, {}};
    if (settings_.landmarks == 68) {
      tavilib::align68Points(wrapped, detection.box, face.points);
    } else if (settings_.landmarks == 5) {
      tavilib::align5Points(wrapped, detection.box, face.points);
    }
    report.faces.push_back(std::move(face));
  }
  if (!settings_.drawFolder.empty()) {
    report.drawError = writeAnnotated(image, report, settings_.drawFolder + "/" + input.drawName);
  }
  return report;
}

}  // namespace tavi
