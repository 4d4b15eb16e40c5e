#include "detector_training/model_folder.h"

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>

#include "nn/util/io.h"

namespace training {

namespace fs = std::filesystem;

namespace {

std::string formatMean(const std::vector<float>& mean) {
  std::ostringstream out;
  for (size_t i = 0; i < mean.size(); ++i) {
    char text[32];
    std::snprintf(text, sizeof text, "%.6g", static_cast<double>(mean[i]));
    // The file must end in white space, or its last number is dropped.
    out << text << (i % 8 == 7 ? "\n" : " ");
  }
  out << "\n";
  return out.str();
}

std::string formatOffsets(const std::vector<tavilib::OffsetScale>& rows) {
  std::ostringstream out;
  for (const tavilib::OffsetScale& row : rows) {
    char text[64];
    std::snprintf(text, sizeof text, "%d %d %.9g\n", row.offsetX, row.offsetY,
                  static_cast<double>(row.scale));
    out << text;
  }
  return out.str();
}

void writeText(const fs::path& path, const std::string& contents) {
  std::ofstream out(path);
  out << contents;
  out.close();
  if (!out) {
    throw std::runtime_error("cannot write " + path.string());
  }
}

void replaceFolder(const fs::path& temporary, const fs::path& folder) {
  fs::remove_all(folder);
  fs::rename(temporary, folder);
}

}  // namespace

void writeFileAtomically(const std::string& path, const std::string& contents) {
  const std::string temporary = path + ".tmp";
  writeText(temporary, contents);
  fs::rename(temporary, path);
}

void writeStageFolder(const std::string& folder, const StageFiles& files) {
  const fs::path temporary = folder + ".tmp";
  fs::remove_all(temporary);
  fs::create_directories(temporary);
  const std::string form = files.fullForm ? "-full" : "-deploy";
  if (!nn::WriteProtoToTextFile(files.description, (temporary / ("prototxt" + form)).string()) ||
      !nn::WriteProtoToBinaryFile(files.weights,
                                  (temporary / (files.fullForm ? "proto-full" : "proto")).string())) {
    throw std::runtime_error("cannot write the net files of " + folder);
  }
  writeText(temporary / "mean", formatMean(files.mean));
  if (!files.offsetsScales.empty()) {
    writeText(temporary / "offsets-scales", formatOffsets(files.offsetsScales));
  }
  replaceFolder(temporary, folder);
}

void copyStageFolder(const std::string& from, const std::string& to) {
  const fs::path temporary = to + ".tmp";
  fs::remove_all(temporary);
  fs::create_directories(fs::path(to).parent_path());
  fs::copy(from, temporary, fs::copy_options::recursive);
  replaceFolder(temporary, to);
}

}  // namespace training
