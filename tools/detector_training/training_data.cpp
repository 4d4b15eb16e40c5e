#include "detector_training/training_data.h"

#include <opencv2/imgcodecs.hpp>

#include <fstream>
#include <set>
#include <sstream>

#include "detector_training/face_box.h"

namespace training {

namespace {

constexpr int kPoints = 68;
// Of every 20 negative images in name order, the first 3 are held out: a
// fixed 15% that spreads over the categories the names begin with.
constexpr int kHoldOutPeriod = 20;
constexpr int kHeldOutPerPeriod = 3;

std::ifstream openOrThrow(const std::string& path) {
  std::ifstream in(path);
  if (!in) {
    throw DataError("cannot open " + path);
  }
  return in;
}

std::string folderOf(const std::string& path) {
  const size_t slash = path.find_last_of('/');
  return slash == std::string::npos ? std::string() : path.substr(0, slash + 1);
}

std::vector<std::string> splitCsvLine(const std::string& line) {
  std::vector<std::string> fields;
  std::stringstream stream(line);
  std::string field;
  while (std::getline(stream, field, ',')) {
    fields.push_back(field);
  }
  return fields;
}

float parseNumber(const std::string& text, const std::string& where) {
  size_t used = 0;
  float value = 0.0f;
  try {
    value = std::stof(text, &used);
  } catch (const std::exception&) {
    used = 0;
  }
  if (used == 0 || used != text.size()) {
    throw DataError(where + ": '" + text + "' is not a number");
  }
  return value;
}

// The files of a sources.txt (tab-separated, file first, '#' comments), each
// with the folder prefixed, in name order.
std::vector<std::string> listSources(const std::string& folder) {
  const std::string path = folder + "sources.txt";
  std::ifstream in = openOrThrow(path);
  std::set<std::string> files;
  std::string line;
  for (int number = 1; std::getline(in, line); ++number) {
    if (line.empty() || line[0] == '#') {
      continue;
    }
    const std::string file = line.substr(0, line.find('\t'));
    if (file.empty() || file == line) {
      throw DataError(path + ":" + std::to_string(number) + ": no tab-separated file name");
    }
    files.insert(folder + file);
  }
  return std::vector<std::string>(files.begin(), files.end());
}

std::vector<std::string> negativeFiles(const std::string& dataRoot, bool heldOut) {
  std::vector<std::string> chosen;
  for (const char* folder : {"negatives/", "scenes/"}) {
    const std::vector<std::string> files = listSources(dataRoot + folder);
    for (size_t i = 0; i < files.size(); ++i) {
      if ((static_cast<int>(i % kHoldOutPeriod) < kHeldOutPerPeriod) == heldOut) {
        chosen.push_back(files[i]);
      }
    }
  }
  return chosen;
}

std::vector<cv::Mat> readImages(const std::vector<std::string>& paths) {
  std::vector<cv::Mat> images(paths.size());
  std::vector<std::string> failures(paths.size());
  cv::parallel_for_(cv::Range(0, static_cast<int>(paths.size())), [&](const cv::Range& range) {
    for (int i = range.start; i < range.end; ++i) {
      try {
        images[i] = readImage(paths[i]);
      } catch (const DataError& error) {
        failures[i] = error.what();
      }
    }
  });
  for (const std::string& failure : failures) {
    if (!failure.empty()) {
      throw DataError(failure);
    }
  }
  return images;
}

void addFaces(const std::string& csvPath, const std::set<std::string>& leftOutPersons,
              DetectorData& data) {
  const std::string folder = folderOf(csvPath);
  std::vector<std::string> paths;
  std::vector<cv::Rect2f> boxes;
  for (const LabelledFace& face : readLabelledFaces(csvPath)) {
    if (leftOutPersons.count(face.person) == 0) {
      paths.push_back(folder + face.file);
      boxes.push_back(faceBoxFromPoints(face.points));
    }
  }
  std::vector<cv::Mat> images = readImages(paths);
  for (size_t i = 0; i < images.size(); ++i) {
    data.faces.push_back({paths[i], std::move(images[i]), boxes[i]});
  }
}

std::set<std::string> personsOf(const std::string& csvPath) {
  std::set<std::string> persons;
  for (const LabelledFace& face : readLabelledFaces(csvPath)) {
    persons.insert(face.person);
  }
  return persons;
}

std::vector<std::string> cropFiles(const std::string& folder) {
  // Every crop listed as a copy of another is left out, so that no copy is
  // counted twice.
  std::set<std::string> copies;
  {
    const std::string path = folder + "duplicates.txt";
    std::ifstream in = openOrThrow(path);
    std::string copy;
    std::string original;
    while (in >> copy >> original) {
      copies.insert(copy);
    }
  }
  std::vector<cv::String> found;
  cv::glob(folder + "images/*.png", found, false);
  if (found.empty()) {
    throw DataError("no face crops in " + folder + "images/");
  }
  std::vector<std::string> files;
  for (const cv::String& path : found) {
    if (copies.count("images/" + path.substr(path.find_last_of('/') + 1)) == 0) {
      files.push_back(path);
    }
  }
  return files;
}

}  // namespace

cv::Mat readImage(const std::string& path) {
  cv::Mat image = cv::imread(path, cv::IMREAD_COLOR);
  if (image.empty()) {
    throw DataError("cannot read image " + path);
  }
  return image;
}

std::vector<LabelledFace> readLabelledFaces(const std::string& csvPath) {
  std::ifstream in = openOrThrow(csvPath);
  std::string line;
  std::getline(in, line);
  const std::vector<std::string> header = splitCsvLine(line);
  // The first x column: after file and person, and a source column in lfw68.
  size_t first = 0;
  while (first < header.size() && header[first] != "x0") {
    ++first;
  }
  if (first + 2 * kPoints > header.size()) {
    throw DataError(csvPath + ":1: no columns x0 to y67");
  }
  std::vector<LabelledFace> faces;
  for (int number = 2; std::getline(in, line); ++number) {
    const std::string where = csvPath + ":" + std::to_string(number);
    const std::vector<std::string> fields = splitCsvLine(line);
    if (fields.size() != header.size()) {
      throw DataError(where + ": " + std::to_string(fields.size()) + " fields, the header has " +
                      std::to_string(header.size()));
    }
    LabelledFace face{fields[0], fields[1], {}};
    for (int p = 0; p < kPoints; ++p) {
      face.points.emplace_back(parseNumber(fields[first + 2 * p], where),
                               parseNumber(fields[first + 2 * p + 1], where));
    }
    faces.push_back(std::move(face));
  }
  return faces;
}

DetectorData loadTrainingData(const std::string& dataRoot) {
  DetectorData data;
  addFaces(dataRoot + "faces68/train.csv", {}, data);
  addFaces(dataRoot + "lfw68/labels.csv", personsOf(dataRoot + "faces68/val.csv"), data);
  data.crops = readImages(cropFiles(dataRoot + "faces36/"));
  data.negativeFiles = negativeFiles(dataRoot, false);
  data.negatives = readImages(data.negativeFiles);
  return data;
}

DetectorData loadValidationData(const std::string& dataRoot) {
  DetectorData data;
  addFaces(dataRoot + "faces68/val.csv", {}, data);
  data.negativeFiles = negativeFiles(dataRoot, true);
  data.negatives = readImages(data.negativeFiles);
  return data;
}

}  // namespace training
