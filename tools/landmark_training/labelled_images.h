#ifndef TOOLS_LANDMARK_TRAINING_LABELLED_IMAGES_H_
#define TOOLS_LANDMARK_TRAINING_LABELLED_IMAGES_H_

#include <opencv2/core.hpp>

#include <map>
#include <set>
#include <string>
#include <vector>

namespace landmarks {

// Decoded frames with their 68 points (x0, y0, ... in image pixels) and the
// face box convention of those points, and the persons they show, numbered
// in order of appearance.
struct LabelledImages {
  std::vector<cv::Mat> images;
  std::vector<size_t> persons;
  std::vector<std::vector<float>> truths;
  std::vector<cv::Rect2f> faces;
  std::map<std::string, size_t> personNumbers;
};

// Adds the faces of a CSV of the data folder (relative image paths resolved
// against its folder), leaving out the listed persons. Throws
// training::DataError naming the file and line of a bad label or image.
void addLabelledImages(const std::string& csvPath, const std::set<std::string>& leftOutPersons,
                       LabelledImages* labelled);

// The persons of a CSV.
std::set<std::string> personsOf(const std::string& csvPath);

}  // namespace landmarks

#endif  // TOOLS_LANDMARK_TRAINING_LABELLED_IMAGES_H_
