#include "tavi/annotation.h"

#include <opencv2/imgcodecs.hpp>
#include <opencv2/imgproc.hpp>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <vector>

namespace tavi {

namespace fs = std::filesystem;

namespace {

void draw(cv::Mat& canvas, const ImageReport& report) {
  const int thickness = std::max(1, std::min(canvas.cols, canvas.rows) / 300);
  for (const FoundFace& face : report.faces) {
    const cv::Point topLeft(static_cast<int>(face.box.left), static_cast<int>(face.box.top));
    cv::rectangle(canvas, topLeft,
                  cv::Point(static_cast<int>(face.box.right), static_cast<int>(face.box.bottom)),
                  cv::Scalar(0, 255, 0), thickness);
    char score[16];
    std::snprintf(score, sizeof score, "%.3f", static_cast<double>(face.score));
    cv::putText(canvas, score, topLeft + cv::Point(0, -4), cv::FONT_HERSHEY_SIMPLEX,
                0.4 * thickness, cv::Scalar(0, 255, 0), thickness);
    for (size_t i = 0; i + 1 < face.points.size(); i += 2) {
      cv::circle(canvas, cv::Point2f(face.points[i], face.points[i + 1]), thickness + 1,
                 cv::Scalar(0, 0, 255), cv::FILLED);
    }
  }
}

}  // namespace

std::string writeAnnotated(const cv::Mat& image, const ImageReport& report, std::string path) {
  cv::Mat canvas = image.clone();
  draw(canvas, report);
  std::vector<uchar> bytes;
  std::string extension = fs::path(path).extension().string();
  bool encoded = false;
  try {
    encoded = !extension.empty() && cv::haveImageWriter(path) && cv::imencode(extension, canvas, bytes);
  } catch (const cv::Exception&) {
    encoded = false;
  }
  if (!encoded) {
    path += ".png";
    cv::imencode(".png", canvas, bytes);
  }
  std::error_code error;
  fs::create_directories(fs::path(path).parent_path(), error);
  const std::string partial = path + ".partial";
  {
    std::ofstream file(partial, std::ios::binary | std::ios::trunc);
    file.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    if (!file) {
      file.close();
      fs::remove(partial, error);
      return "cannot write " + partial;
    }
  }
  fs::rename(partial, path, error);
  if (error) {
    fs::remove(partial, error);
    return "cannot write " + path;
  }
  return {};
}

}  // namespace tavi
