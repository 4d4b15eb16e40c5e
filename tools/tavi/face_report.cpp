#include "tavi/face_report.h"

#include <nlohmann/json.hpp>

#include <charconv>
#include <cstdlib>

namespace tavi {

namespace {

// The shortest decimal that reads back as the same float, so that 0.9 is
// written as 0.9 and not as the double nearest to the float 0.9.
std::string floatText(float value) {
  char text[32];
  const std::to_chars_result end = std::to_chars(text, text + sizeof text, value);
  return std::string(text, end.ptr);
}

double asShortestDouble(float value) { return std::strtod(floatText(value).c_str(), nullptr); }

std::string csvField(const std::string& text) {
  if (text.find_first_of(",\"\n\r") == std::string::npos) {
    return text;
  }
  std::string quoted = "\"";
  for (char c : text) {
    quoted += c == '"' ? std::string("\"\"") : std::string(1, c);
  }
  return quoted + "\"";
}

void addFaces(const ImageReport& report, nlohmann::ordered_json& line) {
  line["width"] = report.width;
  line["height"] = report.height;
  line["min_face"] = report.minFace;
  line["faces"] = nlohmann::ordered_json::array();
  for (const FoundFace& face : report.faces) {
    nlohmann::ordered_json entry;
    entry["box"] = {asShortestDouble(face.box.left), asShortestDouble(face.box.top),
                    asShortestDouble(face.box.right), asShortestDouble(face.box.bottom)};
    entry["score"] = asShortestDouble(face.score);
    if (!face.points.empty()) {
      entry["points"] = nlohmann::ordered_json::array();
      for (size_t i = 0; i + 1 < face.points.size(); i += 2) {
        entry["points"].push_back(
            {asShortestDouble(face.points[i]), asShortestDouble(face.points[i + 1])});
      }
    }
    line["faces"].push_back(entry);
  }
  if (!report.drawError.empty()) {
    line["draw_error"] = report.drawError;
  }
}

}  // namespace

std::string jsonLine(const ImageReport& report) {
  nlohmann::ordered_json line;
  line["file"] = report.file;
  if (!report.error.empty()) {
    line["error"] = report.error;
  } else {
    addFaces(report, line);
  }
  // File names need not be UTF-8; stray bytes become U+FFFD rather than
  // stopping the batch.
  return line.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace);
}

std::string csvHeader(int points) {
  std::string header = "file,width,height,min_face,face,left,top,right,bottom,score";
  for (int k = 0; k < points; ++k) {
    header += ",x" + std::to_string(k) + ",y" + std::to_string(k);
  }
  return header + "\n";
}

std::string csvRows(const ImageReport& report, int points) {
  if (!report.error.empty()) {
    return {};
  }
  const std::string image = csvField(report.file) + "," + std::to_string(report.width) + "," +
                            std::to_string(report.height) + "," + std::to_string(report.minFace);
  if (report.faces.empty()) {
    return image + std::string(6 + 2 * static_cast<size_t>(points), ',') + "\n";
  }
  std::string rows;
  for (size_t f = 0; f < report.faces.size(); ++f) {
    const FoundFace& face = report.faces[f];
    rows += image + "," + std::to_string(f);
    for (float value : {face.box.left, face.box.top, face.box.right, face.box.bottom, face.score}) {
      rows += "," + floatText(value);
    }
    for (float value : face.points) {
      rows += "," + floatText(value);
    }
    rows += "\n";
  }
  return rows;
}

}  // namespace tavi
